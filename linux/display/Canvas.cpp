#include "linux/display/Canvas.h"

#include <xcb/shm.h>

#include <algorithm>
#include <utility>

namespace lumacast::x11 {
namespace {

std::int16_t shortOf(std::int32_t value) {
    return static_cast<std::int16_t>(value);
}
std::uint16_t sizeOf(std::int32_t value) {
    return static_cast<std::uint16_t>(value);
}

PixelRect movedBy(const PixelRect& rect, std::int32_t x, std::int32_t y) {
    return {rect.x + x, rect.y + y, rect.width, rect.height};
}

}  // namespace

Canvas::Canvas(X11Connection& connection)
    : connection_(connection), tree_(connection), context_(xcb_generate_id(connection.get())) {}

Canvas::~Canvas() {
    freePicture();
    if (contextMade_) xcb_free_gc(connection_.get(), context_);
    if (detour_) detour_->detach(connection_);
}

template <class Do>
void Canvas::forEachVisible(Do&& act) const {
    for (std::size_t i = 0; i < arranged_.parts.size(); ++i)
        if (arranged_.parts[i].visible) act(*targets_[arranged_.parts[i].index], i);
}

// Parts know their windows by number, and keep their places.
void Canvas::show(std::vector<CaptureTarget*> targets) {
    if (targets == targets_) return;
    std::vector<Arrangement::Part> kept;
    for (Arrangement::Part part : arranged_.parts) {
        const auto found = std::find(targets.begin(), targets.end(), targets_[part.index]);
        if (found == targets.end()) continue;
        part.index = static_cast<std::size_t>(found - targets.begin());
        kept.push_back(part);
    }
    arranged_.parts = std::move(kept);
    targets_ = std::move(targets);
    std::vector<xcb_window_t> windows;
    for (const CaptureTarget* target : targets_) windows.push_back(target->window());
    tree_.follow(std::move(windows));
    arrangementIsStale_ = true;
    freePicture();
}

// Structure events come only of the windows and of those that they are in.
void Canvas::handle(const xcb_generic_event_t& event) {
    switch (event.response_type) {  // with the bit of those that a window manager sends: they are about nothing new
        case XCB_CONFIGURE_NOTIFY:
        case XCB_CIRCULATE_NOTIFY:
        case XCB_GRAVITY_NOTIFY:
        case XCB_MAP_NOTIFY:
        case XCB_UNMAP_NOTIFY:
        case XCB_REPARENT_NOTIFY:
        case XCB_DESTROY_NOTIFY: arrangementIsStale_ = true; break;
        default: break;
    }
}

bool Canvas::needsRefresh() const {
    return arrangementIsStale_ || std::any_of(targets_.begin(), targets_.end(),
                                              [](const CaptureTarget* target) { return target->needsRefresh(); });
}

void Canvas::refresh() {
    arrangementIsStale_ = false;
    for (CaptureTarget* const target : targets_)
        if (target->needsRefresh()) target->refresh(), target->restore(nullptr);
    Arrangement next = arrange();
    if (next == arranged_ && readable()) return;
    const bool otherSize = next.box.width != width() || next.box.height != height();
    arranged_ = std::move(next);
    if (otherSize || !readable()) makePicture(width(), height());
    stale_.add(PixelRect{0, 0, width(), height()});
    ++layout_;
}

Arrangement Canvas::arrange() {
    const WindowTree::Look look = tree_.look();
    Arrangement next;
    for (const WindowTree::Place& place : look.bottomToTop) {
        const auto found = std::find_if(targets_.begin(), targets_.end(),
                                        [&](const CaptureTarget* target) { return target->window() == place.window; });
        const CaptureTarget& target = **found;
        Arrangement::Part part{static_cast<std::size_t>(found - targets_.begin()),
                               {place.x, place.y, target.width(), target.height()},
                               target.layout(),
                               place.viewable && target.readable()};
        const auto before = std::find_if(arranged_.parts.begin(), arranged_.parts.end(),
                                         [&](const Arrangement::Part& known) { return known.index == part.index; });
        if (!part.visible) {
            if (before == arranged_.parts.end()) continue;
            part.place = before->place;
        }
        next.parts.push_back(part);
    }
    next.enclose(look.screen);
    return next;
}

void Canvas::freePicture() {
    if (picture_ != XCB_NONE) xcb_free_pixmap(connection_.get(), picture_);
    picture_ = XCB_NONE;
}

void Canvas::makePicture(std::int32_t width, std::int32_t height) {
    freePicture();
    stale_.clear();
    if (width < 1 || height < 1) return;
    xcb_connection_t* const x = connection_.get();
    const xcb_screen_t& screen = connection_.screen();
    picture_ = xcb_generate_id(x);
    xcb_create_pixmap(x, screen.root_depth, picture_, screen.root, sizeOf(width), sizeOf(height));
    if (contextMade_) return;
    const std::uint32_t values[] = {0, 0};  // black; no events about copies
    xcb_create_gc(x, context_, picture_, XCB_GC_FOREGROUND | XCB_GC_GRAPHICS_EXPOSURES, values);
    contextMade_ = true;
}

bool Canvas::damaged() const {
    bool any = false;
    forEachVisible([&](const CaptureTarget& target, std::size_t i) {
        any |= target.damaged() || target.layout() != arranged_.parts[i].layout;
    });
    return any;
}

void Canvas::takeDamage(DamageRegion& into) {
    forEachVisible([&](CaptureTarget& target, std::size_t i) {
        Arrangement::Part& part = arranged_.parts[i];
        DamageRegion changed;
        if (target.damaged()) target.takeDamage(changed);
        if (target.layout() != part.layout) changed.add(PixelRect{0, 0, part.place.width, part.place.height});
        part.layout = target.layout();
        for (const PixelRect& rect : changed.rects()) addDamage(i, movedBy(rect, part.place.x, part.place.y), into);
    });
}

void Canvas::addDamage(std::size_t part, const PixelRect& onScreen, DamageRegion& into) {
    const PixelRect shown = intersection(intersection(onScreen, arranged_.parts[part].place), arranged_.box);
    if (isEmpty(shown) || arranged_.isCovered(part, shown)) return;
    const PixelRect onCanvas = movedBy(shown, -arranged_.box.x, -arranged_.box.y);
    stale_.add(onCanvas);
    into.add(onCanvas);
}

std::int64_t Canvas::repaintDeadline() const {
    std::int64_t first = 0;
    forEachVisible([&](const CaptureTarget& target, std::size_t) {
        const std::int64_t deadline = target.repaintDeadline();
        if (deadline != 0 && (first == 0 || deadline < first)) first = deadline;
    });
    return first;
}

void Canvas::repaintIsLate(std::int64_t now) {
    forEachVisible([&](CaptureTarget& target, std::size_t) {
        if (target.repaintDeadline() != 0 && now >= target.repaintDeadline()) target.repaintIsLate(now);
    });
}

bool Canvas::read(const SharedMemory& memory, std::span<const Strip> strips) {
    for (const PixelRect& rect : stale_.rects()) compose(rect);
    stale_.clear();
    const RowsRead rows = readRows(connection_, picture_, {0, 0, width(), height()}, memory, strips);
    if (rows.complete) return true;
    freePicture();
    arrangementIsStale_ = true;
    return false;
}

// From the bottom to the top, beginning with what no other window can be seen through.
void Canvas::compose(const PixelRect& rect) {
    const PixelRect onScreen = movedBy(rect, arranged_.box.x, arranged_.box.y);
    std::size_t part = arranged_.floorOf(onScreen);
    if (part == arranged_.parts.size()) {
        const xcb_rectangle_t black{shortOf(rect.x), shortOf(rect.y), sizeOf(rect.width), sizeOf(rect.height)};
        lastCopy_ = xcb_poly_fill_rectangle(connection_.get(), picture_, context_, 1, &black).sequence;
        part = 0;
    }
    for (; part < arranged_.parts.size(); ++part)
        if (arranged_.parts[part].visible) copy(arranged_.parts[part], onScreen);
}

void Canvas::copy(const Arrangement::Part& part, const PixelRect& onScreen) {
    const PixelRect shown = intersection(onScreen, part.place);
    CaptureTarget& target = *targets_[part.index];
    if (isEmpty(shown) || !target.readable()) return;
    const xcb_rectangle_t from{shortOf(shown.x - part.place.x + target.border()),
                               shortOf(shown.y - part.place.y + target.border()), sizeOf(shown.width),
                               sizeOf(shown.height)};
    const std::int16_t toX = shortOf(shown.x - arranged_.box.x), toY = shortOf(shown.y - arranged_.box.y);
    if (target.depth() != connection_.screen().root_depth) return copyOtherDepth(target, from, toX, toY);
    lastCopy_ = xcb_copy_area(connection_.get(), target.drawable(), picture_, context_, from.x, from.y, toX, toY,
                              from.width, from.height)
                    .sequence;
}

// The server copies only between pictures of one depth. The pixels of both have the same layout, so they go by way of
// memory, where nobody asks how many of their bits count.
void Canvas::copyOtherDepth(CaptureTarget& target, const xcb_rectangle_t& from, std::int16_t toX, std::int16_t toY) {
    xcb_connection_t* const x = connection_.get();
    const std::size_t size = static_cast<std::size_t>(from.width) * from.height * 4;
    if (!detour_ || detour_->bytes().size() < size) {
        if (detour_) detour_->detach(connection_);
        detour_ = SharedMemory::make(connection_, size);
        if (!detour_) return;
    }
    const auto got = xcb_shm_get_image(x, target.drawable(), from.x, from.y, from.width, from.height, ~0u,
                                       XCB_IMAGE_FORMAT_Z_PIXMAP, detour_->segment(), 0);
    xcb_discard_reply(x, got.sequence);
    lastCopy_ =
        xcb_shm_put_image(x, picture_, context_, from.width, from.height, 0, 0, from.width, from.height, toX, toY,
                          connection_.screen().root_depth, XCB_IMAGE_FORMAT_Z_PIXMAP, 0, detour_->segment(), 0)
            .sequence;
}

bool Canvas::overtaken() const {
    bool any = false;
    forEachVisible([&](const CaptureTarget& target, std::size_t) { any |= target.damagedBefore(lastCopy_); });
    return any;
}

}  // namespace lumacast::x11
