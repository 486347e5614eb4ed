#include "linux/display/SharedMemory.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <utility>

namespace lumacast::x11 {

std::optional<SharedMemory> SharedMemory::make(X11Connection& connection, std::size_t size) {
    Fd descriptor(::memfd_create("lumacast-plane", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    if (!descriptor || ::ftruncate(descriptor.get(), static_cast<off_t>(size)) != 0) return std::nullopt;
    if (::fcntl(descriptor.get(), F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW) != 0) return std::nullopt;
    void* const mapped = ::mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, descriptor.get(), 0);
    if (mapped == MAP_FAILED) return std::nullopt;
    SharedMemory memory(std::move(descriptor), static_cast<std::uint8_t*>(mapped), size);

    // The library closes the descriptor that it sends.
    const int sent = ::fcntl(memory.descriptor(), F_DUPFD_CLOEXEC, 0);
    if (sent < 0) return std::nullopt;
    const xcb_shm_seg_t segment = xcb_generate_id(connection.get());
    if (!connection.succeeded(xcb_shm_attach_fd_checked(connection.get(), segment, sent, 0))) return std::nullopt;
    memory.segment_ = segment;
    // Only now: the server had to map it for writing.
    if (::fcntl(memory.descriptor(), F_ADD_SEALS, F_SEAL_FUTURE_WRITE | F_SEAL_SEAL) != 0) return std::nullopt;
    return memory;
}

SharedMemory::SharedMemory(SharedMemory&& other) noexcept
    : descriptor_(std::move(other.descriptor_)),
      memory_(std::exchange(other.memory_, nullptr)),
      size_(std::exchange(other.size_, 0)),
      segment_(std::exchange(other.segment_, 0)) {}

SharedMemory& SharedMemory::operator=(SharedMemory&& other) noexcept {
    std::swap(descriptor_, other.descriptor_);
    std::swap(memory_, other.memory_);
    std::swap(size_, other.size_);
    std::swap(segment_, other.segment_);
    return *this;
}

SharedMemory::~SharedMemory() {
    if (memory_ != nullptr) ::munmap(memory_, size_);
}

void SharedMemory::detach(X11Connection& connection) {
    if (segment_ != 0) xcb_shm_detach(connection.get(), std::exchange(segment_, 0));
}

}  // namespace lumacast::x11
