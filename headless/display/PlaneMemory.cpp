#include "headless/display/PlaneMemory.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <utility>

namespace lumacast::headless {

namespace {

constexpr std::size_t kStrideAlignment = 64;

std::size_t strideOf(std::int32_t width) {
    return (static_cast<std::size_t>(width) * 4 + kStrideAlignment - 1) / kStrideAlignment * kStrideAlignment;
}

std::vector<PixelRect> damageOf(const PlaneMemory& memory, SyntheticPicture::Differs differs) {
    if (differs == SyntheticPicture::Differs::Nowhere) return {};
    return {{0, 0, memory.width(), memory.height()}};
}

}  // namespace

std::shared_ptr<PlaneMemory> PlaneMemory::make(std::int32_t width, std::int32_t height) {
    std::shared_ptr<PlaneMemory> plane(new PlaneMemory(width, height, strideOf(width)));
    const std::size_t size = plane->stride_ * static_cast<std::size_t>(height);
    plane->descriptor_ = Fd(::memfd_create("lumacast-plane", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    const int descriptor = plane->descriptor_.get();
    if (descriptor < 0 || ::ftruncate(descriptor, static_cast<off_t>(size)) != 0) return nullptr;
    void* const mapped = ::mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, descriptor, 0);
    if (mapped == MAP_FAILED) return nullptr;
    plane->memory_ = static_cast<std::uint8_t*>(mapped);
    // The mapping that is there stays writable; nobody gets another such.
    constexpr int kSeals = F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_FUTURE_WRITE | F_SEAL_SEAL;
    return ::fcntl(descriptor, F_ADD_SEALS, kSeals) == 0 ? plane : nullptr;
}

PlaneMemory::~PlaneMemory() {
    if (memory_ != nullptr) ::munmap(memory_, stride_ * static_cast<std::size_t>(height_));
}

SyntheticPicture::SyntheticPicture(std::shared_ptr<PlaneMemory> memory, Differs differs, std::uint64_t number)
    : memory_(std::move(memory)), damage_(damageOf(*memory_, differs)), number_(number) {
    memory_->pictures_.fetch_add(1, std::memory_order_relaxed);
}

// Whatever the holder read, it read before the memory is drawn into again.
SyntheticPicture::~SyntheticPicture() {
    memory_->pictures_.fetch_sub(1, std::memory_order_release);
}

std::shared_ptr<PlaneMemory> PlaneStore::acquire() {
    for (auto& plane : planes_) {
        if (!plane) plane = PlaneMemory::make(width_, height_);
        if (!plane || plane->free()) return plane;
    }
    return nullptr;
}

}  // namespace lumacast::headless
