#pragma once
#include <cstdint>
#include <vector>

#include "extensions/media/Av.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast::extensions {

/// Turns captured planes (BGRX) into planar pictures of one size (BT.601, limited range), upright. Not thread-safe.
class PictureConverter final {
public:
    /// The pictures' size; even numbers.
    PictureConverter(int width, int height) : width_(width), height_(height) {}

    int width() const { return width_; }
    int height() const { return height_; }

    /// A picture of its own; null when there is no memory. `orientation` as EXIF numbers it. A plane of another shape
    /// stands in the middle, with black around it.
    AvOwned<AVFrame> convert(const SharedPlane& plane, std::uint32_t orientation);

    /// The even size that a plane of this size and turn has within the limits, its shape kept; never enlarged.
    struct Size {
        int width, height;
    };
    static Size sizeWithin(int width, int height, std::uint32_t orientation, int mostWidth, int mostHeight);

private:
    /// Three planes in memory that is used again.
    struct Planes {
        void resize(int width, int height);
        int width = 0, height = 0, strideY = 0, strideUV = 0;
        std::vector<std::uint8_t> y, u, v;
    };
    const Planes& upright(const SharedPlane& plane, std::uint32_t orientation);

    const int width_, height_;
    Planes source_, mirrored_, turned_;
};

}  // namespace lumacast::extensions
