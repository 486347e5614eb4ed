#pragma once
// Where a picture goes in a frame of another size. Pure.

#include <cstdint>

#include "linux/display/Turn.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast::x11 {

/// A picture in the middle of a frame, as large as it fits with its shape kept; the rest of the frame is black. A frame
/// whose picture is turned is looked at turned back, "upright": then it is as wide as the frame is high.
struct Fit {
    std::int32_t sourceWidth = 0, sourceHeight = 0;
    PixelRect target;  ///< where in the upright frame
    Turn turn = Turn::None;
    std::int32_t uprightWidth = 0;  ///< of the frame

    bool operator==(const Fit&) const = default;
    /// Whether pixels are copied as they are, turned or not.
    bool exact() const { return target == PixelRect{0, 0, sourceWidth, sourceHeight}; }
    /// The part of the frame that shows anything of `rect` of the window, with the reach of the scaler's filter.
    PixelRect toFrame(const PixelRect& rect) const;
    /// A part of the upright frame, where it is in the frame; and back.
    PixelRect turned(const PixelRect& rect) const;
    PixelRect upright(const PixelRect& rect) const;
};

/// All sizes are at least 1; the frame's are its own, whatever the turn.
Fit fit(std::int32_t sourceWidth, std::int32_t sourceHeight, std::int32_t frameWidth, std::int32_t frameHeight,
        Turn turn = Turn::None);

}  // namespace lumacast::x11
