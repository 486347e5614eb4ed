#pragma once
// Frame memory that nobody but this process writes.

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <vector>

#include "base/Limits.h"
#include "linux/ipc/Fd.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast::headless {

/// One piece of frame memory: a memfd whose size is sealed, and which nobody can map for writing but who made it.
/// Pictures count themselves in and out.
class PlaneMemory final {
public:
    /// Null when there is no memory.
    static std::shared_ptr<PlaneMemory> make(std::int32_t width, std::int32_t height);
    ~PlaneMemory();
    PlaneMemory(const PlaneMemory&) = delete;
    PlaneMemory& operator=(const PlaneMemory&) = delete;

    bool free() const { return pictures_.load(std::memory_order_acquire) == 0; }
    std::int32_t width() const { return width_; }
    std::int32_t height() const { return height_; }
    std::size_t stride() const { return stride_; }
    std::uint8_t* pixels() { return memory_; }

private:
    friend class SyntheticPicture;
    PlaneMemory(std::int32_t width, std::int32_t height, std::size_t stride)
        : width_(width), height_(height), stride_(stride) {}

    const std::int32_t width_, height_;
    const std::size_t stride_;
    Fd descriptor_;
    std::uint8_t* memory_ = nullptr;
    std::atomic<int> pictures_{0};
};

/// A delivered picture. Several may show the same memory. Immutable.
class SyntheticPicture final : public SharedPlane {
public:
    enum class Differs : bool { Nowhere, Everywhere };
    SyntheticPicture(std::shared_ptr<PlaneMemory> memory, Differs differs, std::uint64_t number);
    ~SyntheticPicture() override;

    std::int32_t width() const override { return memory_->width_; }
    std::int32_t height() const override { return memory_->height_; }
    std::size_t stride() const override { return memory_->stride_; }
    std::span<const std::uint8_t> pixels() const override {
        return {memory_->memory_, memory_->stride_ * static_cast<std::size_t>(memory_->height_)};
    }
    std::span<const PixelRect> damage() const override { return damage_; }
    std::uint64_t pictureNumber() const override { return number_; }
    int descriptor() const override { return memory_->descriptor_.get(); }

    const std::shared_ptr<PlaneMemory>& memory() const { return memory_; }

private:
    const std::shared_ptr<PlaneMemory> memory_;
    const std::vector<PixelRect> damage_;
    const std::uint64_t number_;
};

/// The planes of one source: as many as all holders together may have, and some more, so that a slow one costs pictures
/// and never stops the source. Belongs to the source's lane.
class PlaneStore final {
public:
    static constexpr std::size_t kPlanes = 14;
    /// In front of the encoder; lent to the extension and to the application; the last picture.
    static_assert(4 + 2 * limitOf(Limit::PlanesLeased) + 1 < kPlanes);

    PlaneStore(std::int32_t width, std::int32_t height) : width_(width), height_(height) {}
    /// One that no picture shows; null when all are shown, or there is no memory.
    std::shared_ptr<PlaneMemory> acquire();

private:
    const std::int32_t width_, height_;
    std::array<std::shared_ptr<PlaneMemory>, kPlanes> planes_;
};

}  // namespace lumacast::headless
