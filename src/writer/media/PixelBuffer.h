#pragma once
// The picture of one video frame and the memory behind it.

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <utility>
#include <vector>

namespace lumacast {

/// A rectangle of whole pixels.
struct PixelRect {
    std::int32_t x = 0, y = 0, width = 0, height = 0;
    bool operator==(const PixelRect&) const = default;
};

/// Frame memory that can be shared with other processes without copying. 32-bit pixels, bytes blue, green, red, unused
/// (BGRX), rows from top to bottom, `stride()` bytes apart.
///
/// Ownership: by shared_ptr; a plane goes back to its pool when the last holder lets go of it, from whatever lane. Its
/// pixels don't change while anybody but the pool holds it.
class SharedPlane {
public:
    virtual ~SharedPlane() = default;
    virtual std::int32_t width() const = 0;
    virtual std::int32_t height() const = 0;
    virtual std::size_t stride() const = 0;
    /// The pixels, height() * stride() bytes.
    virtual std::span<const std::uint8_t> pixels() const = 0;
    /// What may differ from the picture that was delivered before this one; empty when nothing differs. A consumer that
    /// has not seen that picture must take the whole plane.
    virtual std::span<const PixelRect> damage() const = 0;
    /// Consecutive number of the picture within its source, for deciding whether damage() can be used.
    virtual std::uint64_t pictureNumber() const = 0;
    /// The descriptor to hand to another process, or -1 when the plane has none. Stays the plane's.
    virtual int descriptor() const = 0;
};

/// The image of one video frame. A value; copies share the plane.
class PixelBuffer {
public:
    PixelBuffer() = default;
    explicit PixelBuffer(std::shared_ptr<SharedPlane> plane) : plane_(std::move(plane)) {}

    std::size_t width() const { return plane_ ? static_cast<std::size_t>(plane_->width()) : 0; }
    std::size_t height() const { return plane_ ? static_cast<std::size_t>(plane_->height()) : 0; }
    const std::shared_ptr<SharedPlane>& plane() const { return plane_; }

private:
    std::shared_ptr<SharedPlane> plane_;
};

}  // namespace lumacast
