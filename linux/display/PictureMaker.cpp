#include "linux/display/PictureMaker.h"

#include <libyuv/convert_argb.h>
#include <libyuv/planar_functions.h>
#include <libyuv/scale_argb.h>

#include <algorithm>
#include <cstring>
#include <utility>

namespace lumacast::x11 {
namespace {

// A request costs about as much as this many rows.
constexpr std::int32_t kCheapRows = 8;
constexpr std::int64_t kTidyingInterval = 5'000'000'000;

struct Strips {
    std::array<Strip, DamageRegion::kMaximumRects> strips;
    std::size_t count = 0;
    std::span<const Strip> span() const { return {strips.data(), count}; }
};

// The rows that a region touches, from top to bottom, without overlaps.
Strips rowsOf(const DamageRegion& region) {
    Strips rows;
    for (const PixelRect& rect : region.rects()) rows.strips[rows.count++] = {rect.y, rect.height};
    const auto begin = rows.strips.begin();
    std::sort(begin, begin + static_cast<std::ptrdiff_t>(rows.count),
              [](const Strip& a, const Strip& b) { return a.y < b.y; });
    std::size_t last = 0;
    for (std::size_t i = 1; i < rows.count; ++i) {
        Strip& above = rows.strips[last];
        const Strip& strip = rows.strips[i];
        if (strip.y <= above.y + above.height + kCheapRows)
            above.height = std::max(above.y + above.height, strip.y + strip.height) - above.y;
        else
            rows.strips[++last] = strip;
    }
    rows.count = rows.count == 0 ? 0 : last + 1;
    return rows;
}

// Premultiplied colours: what shines through is added to them.
void drawOver(const std::uint32_t* over, std::uint8_t* under, std::int32_t pixels) {
    for (std::int32_t x = 0; x < pixels; ++x, under += 4) {
        const std::uint32_t pixel = over[x], through = 255 - (pixel >> 24);
        for (int byte = 0; byte < 3; ++byte) {
            const std::uint32_t own = pixel >> (8 * byte) & 0xFF;
            under[byte] = static_cast<std::uint8_t>(std::min(255u, own + (under[byte] * through + 127) / 255));
        }
    }
}

}  // namespace

PictureMaker::PictureMaker(X11Connection& connection, std::int32_t width, std::int32_t height)
    : connection_(connection), pool_(width, height), tracker_(kPlanes, width, height) {}

PictureMaker::~PictureMaker() {
    if (image_) image_->detach(connection_);
    pool_.detach(connection_);
}

void PictureMaker::follow(const PictureSource& target, Turn turn) {
    source_ = target.id();
    layout_ = target.layout();
    if (!target.readable()) return;
    const Fit fitted = fit(target.width(), target.height(), pool_.width(), pool_.height(), turn);
    if (image_ && (fitted.sourceWidth != fit_.sourceWidth || fitted.sourceHeight != fit_.sourceHeight)) {
        image_->detach(connection_);
        image_.reset();
    }
    fit_ = fitted;
    imageStale_.clear();
    imageStale_.add(PixelRect{0, 0, fit_.sourceWidth, fit_.sourceHeight});
    drawnOver_ = {};
    tracker_.addAll();
}

void PictureMaker::add(const DamageRegion& damage) {
    const PixelRect whole{0, 0, fit_.sourceWidth, fit_.sourceHeight};
    for (const PixelRect& rect : damage.rects()) {
        const PixelRect inside = intersection(rect, whole);
        imageStale_.add(inside);
        tracker_.add(fit_.toFrame(inside));
    }
}

std::optional<std::size_t> PictureMaker::acquire() {
    return pool_.acquire(connection_, [this](std::size_t plane) {
        std::int64_t pixels = 0;
        for (const PixelRect& rect : tracker_.ofPlane(plane).rects()) pixels += area(rect);
        return pixels;
    });
}

bool PictureMaker::update(std::size_t index, PictureSource& target) {
    Plane& plane = *pool_.plane(index);
    if (planeFits_[index] != fit_) {
        // Whatever it showed before, at another place perhaps.
        const auto bytes = plane.memory().bytes();
        std::memset(bytes.data(), 0, bytes.size());
        planeFits_[index] = fit_;
    }
    const bool done = isDirect(plane) && target.overlay().pixels.empty() ? updateDirectly(index, target) : updateFromImage(index, target);
    if (done) tracker_.planeIsCurrent(index);
    needed_[index] = true;
    return done;
}

void PictureMaker::tidy(std::int64_t now) {
    if (now < nextTidying_) return;
    nextTidying_ = now + kTidyingInterval;
    for (std::size_t i = 0; i < kPlanes; ++i) {
        const bool idle = !std::exchange(needed_[i], false);
        if (!idle || !pool_.plane(i) || !pool_.plane(i)->free()) continue;
        pool_.giveBack(i, connection_);
        tracker_.planeIsGone(i);
    }
}

bool PictureMaker::isDirect(const Plane& plane) const {
    const bool rowsAreTight = plane.stride() == static_cast<std::size_t>(fit_.sourceWidth) * 4;
    return fit_.exact() && rowsAreTight && fit_.turn == Turn::None && isEmpty(drawnOver_);
}

bool PictureMaker::updateDirectly(std::size_t index, PictureSource& target) {
    const Strips rows = rowsOf(tracker_.ofPlane(index));
    return target.read(pool_.plane(index)->memory(), rows.span());
}

bool PictureMaker::updateFromImage(std::size_t index, PictureSource& target) {
    if (!readImage(target)) return false;
    for (const PixelRect& rect : tracker_.ofPlane(index).rects()) show(rect, *pool_.plane(index));
    return true;
}

bool PictureMaker::readImage(PictureSource& target) {
    const auto size = static_cast<std::size_t>(fit_.sourceWidth) * static_cast<std::size_t>(fit_.sourceHeight) * 4;
    if (!image_) {
        image_ = SharedMemory::make(connection_, size);
        if (!image_) return false;
        imageStale_.add(PixelRect{0, 0, fit_.sourceWidth, fit_.sourceHeight});
    }
    // What was drawn over is read again.
    imageStale_.add(drawnOver_);
    const Strips rows = rowsOf(imageStale_);
    if (!target.read(*image_, rows.span())) return false;
    imageStale_.clear();
    draw(target.overlay());
    return true;
}

void PictureMaker::draw(const Overlay& overlay) {
    const PixelRect& place = overlay.place;
    drawnOver_ = overlay.pixels.empty() ? PixelRect{}
                                        : intersection(place, PixelRect{0, 0, fit_.sourceWidth, fit_.sourceHeight});
    const int stride = fit_.sourceWidth * 4;
    for (std::int32_t y = drawnOver_.y; y < drawnOver_.y + drawnOver_.height; ++y)
        drawOver(overlay.pixels.data() + (y - place.y) * place.width + (drawnOver_.x - place.x),
                 image_->bytes().data() + y * stride + drawnOver_.x * 4, drawnOver_.width);
}

// Copies, scales or turns the part of the picture that lies in `rect` of the frame.
void PictureMaker::show(const PixelRect& rect, Plane& plane) {
    const PixelRect visible = intersection(fit_.upright(rect), fit_.target);
    if (isEmpty(visible)) return;
    const std::uint8_t* from = image_->bytes().data();
    int fromStride = fit_.sourceWidth * 4;
    const int toStride = static_cast<int>(plane.stride());
    std::uint8_t* const frame = plane.memory().bytes().data();
    if (fit_.turn == Turn::None) {
        if (!fit_.exact()) return scale(visible, frame, toStride);
        libyuv::ARGBCopy(from + visible.y * fromStride + visible.x * 4, fromStride,
                         frame + visible.y * toStride + visible.x * 4, toStride, visible.width, visible.height);
        return;
    }
    if (!fit_.exact()) {
        fromStride = plane.height() * 4;
        scaled_.resize(static_cast<std::size_t>(fromStride) * static_cast<std::size_t>(plane.width()));
        scale(visible, scaled_.data(), fromStride);
        from = scaled_.data();
    }
    const PixelRect place = fit_.turned(visible);
    turnCounterclockwise(from + visible.y * fromStride + visible.x * 4, static_cast<std::size_t>(fromStride),
                         frame + place.y * toStride + place.x * 4, plane.stride(), visible.width, visible.height);
}

// Into an upright frame.
void PictureMaker::scale(const PixelRect& rect, std::uint8_t* frame, int stride) const {
    libyuv::ARGBScaleClip(image_->bytes().data(), fit_.sourceWidth * 4, fit_.sourceWidth, fit_.sourceHeight,
                          frame + fit_.target.y * stride + fit_.target.x * 4, stride, fit_.target.width,
                          fit_.target.height, rect.x - fit_.target.x, rect.y - fit_.target.y, rect.width, rect.height,
                          libyuv::kFilterBilinear);
}

std::shared_ptr<Picture> PictureMaker::picture(std::size_t plane, std::uint64_t number) {
    return pictures_.make(pool_.plane(plane), tracker_.sinceDelivery(), number);
}

}  // namespace lumacast::x11
