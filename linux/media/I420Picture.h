#pragma once
#include <cstddef>
#include <cstdint>
#include <memory>
#include <new>

namespace lumacast::media {

/// A planar 4:2:0 picture in memory of its own: the encoder's input. Sizes in pixels; both are even.
class I420Picture final {
public:
    /// Contents are undefined until they are written. Sizes are rounded up to even numbers.
    I420Picture(int width, int height)
        : width_(width + (width & 1)), height_(height + (height & 1)), lumaStride_(aligned(width_)),
          chromaStride_(aligned(width_ / 2)), bytes_(allocate(byteCount())) {}

    int width() const { return width_; }
    int height() const { return height_; }
    int lumaStride() const { return lumaStride_; }
    int chromaStride() const { return chromaStride_; }

    std::uint8_t* y() { return bytes_.get(); }
    std::uint8_t* u() { return y() + lumaBytes(); }
    std::uint8_t* v() { return u() + chromaBytes(); }
    const std::uint8_t* y() const { return bytes_.get(); }
    const std::uint8_t* u() const { return y() + lumaBytes(); }
    const std::uint8_t* v() const { return u() + chromaBytes(); }

    std::size_t byteCount() const { return lumaBytes() + 2 * chromaBytes() + kPadding; }

private:
    /// Rows begin on cache lines, and vector code may read a little past the last one.
    static constexpr std::size_t kAlignment = 64;
    static constexpr std::size_t kPadding = 64;

    struct Free {
        void operator()(std::uint8_t* bytes) const { ::operator delete(bytes, std::align_val_t(kAlignment)); }
    };

    static int aligned(int bytes) { return (bytes + 63) / 64 * 64; }
    static std::uint8_t* allocate(std::size_t bytes) {
        return static_cast<std::uint8_t*>(::operator new(bytes, std::align_val_t(kAlignment)));
    }
    std::size_t lumaBytes() const { return static_cast<std::size_t>(lumaStride_) * static_cast<std::size_t>(height_); }
    std::size_t chromaBytes() const {
        return static_cast<std::size_t>(chromaStride_) * static_cast<std::size_t>(height_ / 2);
    }

    int width_, height_, lumaStride_, chromaStride_;
    std::unique_ptr<std::uint8_t, Free> bytes_;
};

}  // namespace lumacast::media
