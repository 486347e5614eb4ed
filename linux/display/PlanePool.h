#pragma once
// Frame memory: sealed memfds that the display server writes and everybody else reads.

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <utility>

#include "base/Limits.h"
#include "linux/display/DamageRegion.h"
#include "linux/display/SharedMemory.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast::x11 {

/// How many planes the holders may have at a time. The pool is larger than all quotas together, so a slow consumer
/// costs frames and never stops the source.
struct PlaneQuota {
    std::size_t encoder = 4;                               ///< waiting in front of the encoder, and in it
    std::size_t extension = limitOf(Limit::PlanesLeased);  ///< lent to a broadcast extension
    std::size_t client = limitOf(Limit::PlanesLeased);     ///< lent to the recorded application
    std::size_t source = 1;                                ///< the current picture, for repeats
};
inline constexpr PlaneQuota kPlaneQuota;
inline constexpr std::size_t kPlanes = 14;
static_assert(kPlaneQuota.encoder + kPlaneQuota.extension + kPlaneQuota.client + kPlaneQuota.source < kPlanes);

/// One piece of frame memory of the pool. Pictures count themselves in and out; the pool writes only what no picture
/// holds.
class Plane final {
public:
    Plane(SharedMemory memory, std::int32_t width, std::int32_t height, std::size_t stride)
        : memory_(std::move(memory)), width_(width), height_(height), stride_(stride) {}

    bool free() const { return pictures_.load(std::memory_order_acquire) == 0; }
    std::int32_t width() const { return width_; }
    std::int32_t height() const { return height_; }
    std::size_t stride() const { return stride_; }
    SharedMemory& memory() { return memory_; }
    const SharedMemory& memory() const { return memory_; }

private:
    friend class Picture;
    SharedMemory memory_;
    const std::int32_t width_, height_;
    const std::size_t stride_;
    std::atomic<int> pictures_{0};
};

/// A delivered picture: a plane, as what differs from the picture before it. Several may show the same plane (a still
/// window is repeated without copying). Immutable.
class Picture final : public SharedPlane {
public:
    Picture(std::shared_ptr<Plane> plane, const DamageRegion& damage, std::uint64_t number);
    ~Picture() override;

    std::int32_t width() const override { return plane_->width(); }
    std::int32_t height() const override { return plane_->height(); }
    std::size_t stride() const override { return plane_->stride(); }
    std::span<const std::uint8_t> pixels() const override { return std::as_const(*plane_).memory().bytes(); }
    std::span<const PixelRect> damage() const override { return damage_.rects(); }
    std::uint64_t pictureNumber() const override { return number_; }
    int descriptor() const override { return plane_->memory().descriptor(); }

    const std::shared_ptr<Plane>& plane() const { return plane_; }

private:
    const std::shared_ptr<Plane> plane_;
    const DamageRegion damage_;
    const std::uint64_t number_;
};

/// The planes of one source on one display connection. Belongs to the frame lane. Pictures may outlive it.
class PlanePool final {
public:
    PlanePool(std::int32_t width, std::int32_t height);

    std::int32_t width() const { return width_; }
    std::int32_t height() const { return height_; }

    /// A plane that no picture holds, of those there are the one that needs the least reading; memory is made when
    /// first needed. None when all are held or there is no memory. `staleness` says how much of a plane is out of date.
    template <class Staleness>
    std::optional<std::size_t> acquire(X11Connection& connection, const Staleness& staleness) {
        std::optional<std::size_t> best;
        std::int64_t least = 0;
        for (std::size_t i = 0; i < planes_.size(); ++i) {
            if (!planes_[i] || !planes_[i]->free()) continue;
            const std::int64_t amount = staleness(i);
            if (!best || amount < least) best = i, least = amount;
        }
        return best ? best : make(connection);
    }
    const std::shared_ptr<Plane>& plane(std::size_t index) const { return planes_[index]; }
    /// Gives the memory of a plane back that no picture holds; it is made anew when it is needed.
    void giveBack(std::size_t index, X11Connection& connection);
    /// The server forgets the planes; pictures keep them. Only on the connection they were made on.
    void detach(X11Connection& connection);

private:
    std::optional<std::size_t> make(X11Connection& connection);

    const std::int32_t width_, height_;
    const std::size_t stride_;
    std::array<std::shared_ptr<Plane>, kPlanes> planes_;
};

}  // namespace lumacast::x11
