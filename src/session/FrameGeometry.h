#pragma once
// The geometry of captured frames: pure functions.

#include <cstdint>

#include "base/Identifiers.h"
#include "base/Log.h"
#include "platform/DisplayCapture.h"

namespace lumacast {

/// `_frameTransformFromFlags:` — the window transform of a frame with these FrameTransformFlags: rotated by a quarter,
/// then mirrored in x, then in y. A rotated row keeps the cosine of a quarter as it comes out of the library, not an
/// exact 0.
AffineTransform frameTransformFromFlags(Log& log, std::uint32_t flags);

/// `orientationFromFrameTransform:` — the EXIF orientation (1 to 8) of a frame with these flags; 1 for any value that
/// has a bit without meaning.
std::uint32_t orientationFromFrameTransform(std::uint32_t flags);

/// The size scaled down until neither length is over `limit`: height first, then the width that came out. Unrounded.
Size fittedWithin(Size size, double limit);

}  // namespace lumacast
