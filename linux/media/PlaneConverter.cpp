#include "linux/media/PlaneConverter.h"

#include <libyuv.h>

#include <algorithm>
#include <cstring>

namespace lumacast::media {

namespace {

/// The part of `rect` inside a plane of this size, grown to even edges: a chroma sample stands for two by two pixels.
PixelRect evenPart(PixelRect rect, std::int32_t width, std::int32_t height) {
    const auto clamp = [](std::int64_t value, std::int32_t limit) {
        return static_cast<std::int32_t>(std::clamp<std::int64_t>(value, 0, limit));
    };
    const std::int32_t left = clamp(rect.x, width) & ~1, top = clamp(rect.y, height) & ~1;
    const std::int32_t right = clamp(std::int64_t{rect.x} + std::max(rect.width, 0), width);
    const std::int32_t bottom = clamp(std::int64_t{rect.y} + std::max(rect.height, 0), height);
    return {left, top, std::min(right + (right & 1), width) - left, std::min(bottom + (bottom & 1), height) - top};
}

bool isEmpty(const PixelRect& rect) { return rect.width <= 0 || rect.height <= 0; }

/// Fills the column and the row that an odd source leaves at the picture's right and lower edge. Chroma needs nothing:
/// its last sample already stands for the odd pixel.
void extendEdges(I420Picture& picture, std::int32_t sourceWidth, std::int32_t sourceHeight) {
    const auto stride = static_cast<std::size_t>(picture.lumaStride());
    if (sourceWidth < picture.width()) {
        for (std::int32_t row = 0; row < sourceHeight; ++row) {
            std::uint8_t* const end = picture.y() + static_cast<std::size_t>(row) * stride + sourceWidth;
            *end = end[-1];
        }
    }
    if (sourceHeight < picture.height()) {
        std::uint8_t* const last = picture.y() + static_cast<std::size_t>(sourceHeight) * stride;
        std::memcpy(last, last - stride, static_cast<std::size_t>(picture.width()));
    }
}

}  // namespace

PlaneConverter::PlaneConverter(int width, int height) : target_(std::make_shared<I420Picture>(width, height)) {}

bool PlaneConverter::follows(const SharedPlane& plane) const {
    return lastNumber_ && plane.pictureNumber() == *lastNumber_ + 1;
}

const std::shared_ptr<I420Picture>& PlaneConverter::convert(const SharedPlane& plane) {
    const std::int32_t width = plane.width(), height = plane.height();
    const bool sane = width > 0 && height > 0 && width <= 16384 && height <= 16384 &&
                      plane.stride() >= static_cast<std::size_t>(width) * 4 &&
                      plane.pixels().size() / plane.stride() >= static_cast<std::size_t>(height);
    if (!sane) return nothing_;

    if (width != sourceWidth_ || height != sourceHeight_) {
        sourceWidth_ = width;
        sourceHeight_ = height;
        lastNumber_.reset();
        const bool fits = width + (width & 1) == target_->width() && height + (height & 1) == target_->height();
        unscaled_ = fits ? nullptr : std::make_unique<I420Picture>(width, height);
    }

    I420Picture& direct = unscaled_ ? *unscaled_ : *target_;
    const bool changed = convertDamage(plane, direct);
    lastNumber_ = plane.pictureNumber();
    if (!changed) return target_;
    extendEdges(direct, width, height);
    if (unscaled_) {
        libyuv::I420Scale(direct.y(), direct.lumaStride(), direct.u(), direct.chromaStride(), direct.v(),
                          direct.chromaStride(), direct.width(), direct.height(), target_->y(), target_->lumaStride(),
                          target_->u(), target_->chromaStride(), target_->v(), target_->chromaStride(),
                          target_->width(), target_->height(), libyuv::kFilterBox);
    }
    return target_;
}

/// Whether anything was converted.
bool PlaneConverter::convertDamage(const SharedPlane& plane, I420Picture& into) {
    const PixelRect whole{0, 0, sourceWidth_, sourceHeight_};
    if (!follows(plane)) {
        convertRect(plane, whole, into);
        return true;
    }
    std::int64_t damaged = 0;
    for (const PixelRect& rect : plane.damage()) {
        const PixelRect part = evenPart(rect, sourceWidth_, sourceHeight_);
        if (!isEmpty(part)) damaged += std::int64_t{part.width} * part.height;
    }
    if (damaged == 0) return false;
    if (damaged >= std::int64_t{sourceWidth_} * sourceHeight_) {  // also many rectangles one over the other
        convertRect(plane, whole, into);
        return true;
    }
    for (const PixelRect& rect : plane.damage()) {
        const PixelRect part = evenPart(rect, sourceWidth_, sourceHeight_);
        if (!isEmpty(part)) convertRect(plane, part, into);
    }
    return true;
}

/// `rect` begins on even coordinates and lies inside the plane. libyuv's "ARGB" names a little-endian word, which in
/// memory is blue, green, red, unused; its conversion is BT.601, limited range.
void PlaneConverter::convertRect(const SharedPlane& plane, PixelRect rect, I420Picture& into) {
    const auto x = static_cast<std::size_t>(rect.x), y = static_cast<std::size_t>(rect.y);
    const auto lumaStride = static_cast<std::size_t>(into.lumaStride());
    const auto chromaStride = static_cast<std::size_t>(into.chromaStride());
    const std::size_t chroma = y / 2 * chromaStride + x / 2;
    libyuv::ARGBToI420(plane.pixels().data() + y * plane.stride() + x * 4, static_cast<int>(plane.stride()),
                       into.y() + y * lumaStride + x, into.lumaStride(), into.u() + chroma, into.chromaStride(),
                       into.v() + chroma, into.chromaStride(), rect.width, rect.height);
    convertedPixels_ += static_cast<std::uint64_t>(rect.width) * static_cast<std::uint64_t>(rect.height);
}

}  // namespace lumacast::media
