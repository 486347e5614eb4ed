#pragma once
// The geometry of captured frames: pure functions.

#include <cstdint>

#include "base/Identifiers.h"
#include "base/Log.h"

namespace lumacast {

/// The bits of a capture source's transform flags. Higher bits carry no meaning.
enum FrameTransformFlag : std::uint32_t { kFlipY = 1, kFlipX = 2, kRotateClockwise = 4 };

/// `_frameTransformFromFlags:` — the window transform of a frame: rotated by a quarter, then mirrored in x, then in y.
/// A rotated row keeps the cosine of a quarter as it comes out of the library, not an exact 0.
AffineTransform frameTransformFromFlags(Log& log, std::uint32_t flags);

/// `orientationFromFrameTransform:` — the EXIF orientation (1 to 8) of a frame with these flags; 1 for any value that
/// has a bit without meaning.
std::uint32_t orientationFromFrameTransform(std::uint32_t flags);

/// The size scaled down until neither length is over `limit`: height first, then the width that came out. Unrounded.
Size fittedWithin(Size size, double limit);

}  // namespace lumacast
