#include "linux/display/PictureMaker.h"

#include <libyuv/convert_argb.h>
#include <libyuv/planar_functions.h>
#include <libyuv/scale_argb.h>

#include <algorithm>
#include <cstring>

namespace lumacast::x11 {
namespace {

// A request costs about as much as this many rows.
constexpr std::int32_t kCheapRows = 8;

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

}  // namespace

PictureMaker::PictureMaker(X11Connection& connection, std::int32_t width, std::int32_t height)
    : connection_(connection), pool_(width, height), tracker_(kPlanes, width, height) {}

PictureMaker::~PictureMaker() {
    if (image_) image_->detach(connection_);
}

void PictureMaker::follow(const PictureSource& target) {
    source_ = target.id();
    layout_ = target.layout();
    if (!target.readable()) return;
    const Fit fitted = fit(target.width(), target.height(), pool_.width(), pool_.height());
    if (image_ && (fitted.sourceWidth != fit_.sourceWidth || fitted.sourceHeight != fit_.sourceHeight)) {
        image_->detach(connection_);
        image_.reset();
    }
    fit_ = fitted;
    imageStale_.clear();
    imageStale_.add(PixelRect{0, 0, fit_.sourceWidth, fit_.sourceHeight});
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
    const bool rowsAreTight = plane.stride() == static_cast<std::size_t>(fit_.sourceWidth) * 4;
    const bool done = fit_.exact() && rowsAreTight ? updateDirectly(index, target) : updateFromImage(index, target);
    if (done) tracker_.planeIsCurrent(index);
    return done;
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
    const Strips rows = rowsOf(imageStale_);
    if (!target.read(*image_, rows.span())) return false;
    imageStale_.clear();
    return true;
}

// Copies or scales the part of the window that lies in `rect` of the frame.
void PictureMaker::show(const PixelRect& rect, Plane& plane) {
    const PixelRect visible = intersection(rect, fit_.target);
    if (isEmpty(visible)) return;
    const std::uint8_t* const from = image_->bytes().data();
    const int fromStride = fit_.sourceWidth * 4;
    const int toStride = static_cast<int>(plane.stride());
    std::uint8_t* const bytes = plane.memory().bytes().data();
    if (fit_.exact()) {
        libyuv::ARGBCopy(from + visible.y * fromStride + visible.x * 4, fromStride,
                         bytes + visible.y * toStride + visible.x * 4, toStride, visible.width, visible.height);
        return;
    }
    std::uint8_t* const to = bytes + fit_.target.y * toStride + fit_.target.x * 4;
    libyuv::ARGBScaleClip(from, fromStride, fit_.sourceWidth, fit_.sourceHeight, to, toStride, fit_.target.width,
                          fit_.target.height, visible.x - fit_.target.x, visible.y - fit_.target.y, visible.width,
                          visible.height, libyuv::kFilterBilinear);
}

std::shared_ptr<Picture> PictureMaker::picture(std::size_t plane, std::uint64_t number) {
    return std::make_shared<Picture>(pool_.plane(plane), tracker_.sinceDelivery(), number);
}

}  // namespace lumacast::x11
