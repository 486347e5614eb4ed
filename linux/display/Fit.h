#pragma once
// Where a window's picture goes in a frame of another size. Pure.

#include <cstdint>

#include "writer/media/PixelBuffer.h"

namespace lumacast::x11 {

/// A window's picture in the middle of a frame, as large as it fits with its shape kept; the rest of the frame is
/// black.
struct Fit {
    std::int32_t sourceWidth = 0, sourceHeight = 0;
    PixelRect target;  ///< where in the frame

    bool operator==(const Fit&) const = default;
    /// Whether pixels are copied as they are.
    bool exact() const { return target == PixelRect{0, 0, sourceWidth, sourceHeight}; }
    /// The part of the frame that shows anything of `rect` of the window, with the reach of the scaler's filter.
    PixelRect toFrame(const PixelRect& rect) const;
};

/// All sizes are at least 1.
Fit fit(std::int32_t sourceWidth, std::int32_t sourceHeight, std::int32_t frameWidth, std::int32_t frameHeight);

}  // namespace lumacast::x11
