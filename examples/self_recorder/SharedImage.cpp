#include "examples/self_recorder/SharedImage.h"

#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "examples/self_recorder/UniqueFd.h"

namespace lumacast::example {

SharedImage::SharedImage(xcb_connection_t* connection, int width, int height) : connection_(connection) {
    const std::size_t stride = static_cast<std::size_t>(width) * 4;
    bytes_ = stride * static_cast<std::size_t>(height);
    UniqueFd memory(::memfd_create("self_recorder", MFD_CLOEXEC));
    if (!memory.valid() || ::ftruncate(memory.get(), static_cast<off_t>(bytes_)) != 0) {
        error_ = std::string("no shared memory: ") + std::strerror(errno);
        return;
    }
    void* const mapped = ::mmap(nullptr, bytes_, PROT_READ | PROT_WRITE, MAP_SHARED, memory.get(), 0);
    if (mapped == MAP_FAILED) {
        error_ = std::string("no shared memory: ") + std::strerror(errno);
        return;
    }
    memory_ = mapped;
    const xcb_shm_seg_t segment = xcb_generate_id(connection_);
    // The library closes the descriptor once it is sent.
    const auto cookie = xcb_shm_attach_fd_checked(connection_, segment, memory.release(), 0);
    const std::unique_ptr<xcb_generic_error_t, decltype(&std::free)> refused(xcb_request_check(connection_, cookie),
                                                                             &std::free);
    if (refused) {
        error_ = "the display refused shared memory";
        return;
    }
    segment_ = segment;
    picture_ = {static_cast<std::uint8_t*>(memory_), width, height, stride};
}

SharedImage::~SharedImage() {
    if (segment_ != 0) xcb_shm_detach(connection_, segment_);
    if (memory_ != nullptr) ::munmap(memory_, bytes_);
}

}  // namespace lumacast::example
