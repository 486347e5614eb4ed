#include "session/FrameGeometry.h"

#include <cmath>
#include <iterator>
#include <numbers>

namespace lumacast {

namespace {

AffineTransform rotatedAfter(const AffineTransform& t, double angle) {
    const double cosine = std::cos(angle), sine = std::sin(angle);
    return {t.a * cosine + t.b * -sine,   t.a * sine + t.b * cosine,   t.c * cosine + t.d * -sine,
            t.c * sine + t.d * cosine,    t.tx * cosine + t.ty * -sine, t.tx * sine + t.ty * cosine};
}

/// Scaled before `t`.
AffineTransform scaled(const AffineTransform& t, double x, double y) {
    return {t.a * x, t.b * x, t.c * y, t.d * y, t.tx, t.ty};
}

}  // namespace

AffineTransform frameTransformFromFlags(Log& log, std::uint32_t flags) {
    AffineTransform transform;
    if (flags & kRotateClockwise) {
        log.sample("rotate clockwise");
        transform = rotatedAfter(transform, std::numbers::pi / 2);
    }
    if (flags & kFlipX) {
        log.sample("flip x");
        transform = scaled(transform, -1, 1);
    }
    if (flags & kFlipY) {
        log.sample("flip y");
        transform = scaled(transform, 1, -1);
    }
    return transform;
}

std::uint32_t orientationFromFrameTransform(std::uint32_t flags) {
    constexpr std::uint32_t kOrientations[] = {1, 4, 2, 3, 8, 5, 7, 6};
    return flags < std::size(kOrientations) ? kOrientations[flags] : 1;
}

Size fittedWithin(Size size, double limit) {
    if (size.height > limit) size = {size.width * (limit / size.height), limit};
    if (size.width > limit) size = {limit, size.height * (limit / size.width)};
    return size;
}

}  // namespace lumacast
