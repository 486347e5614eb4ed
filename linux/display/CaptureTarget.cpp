#include "linux/display/CaptureTarget.h"

#include <xcb/composite.h>
#include <xcb/damage.h>

#include <algorithm>
#include <array>

namespace lumacast::x11 {
namespace {

// Request numbers wrap around.
bool before(std::uint32_t a, std::uint32_t b) { return static_cast<std::int32_t>(a - b) < 0; }

constexpr std::uint32_t kWindowEvents =
    XCB_EVENT_MASK_STRUCTURE_NOTIFY | XCB_EVENT_MASK_EXPOSURE | XCB_EVENT_MASK_VISIBILITY_CHANGE;
constexpr std::uint32_t kScreenEvents = XCB_EVENT_MASK_STRUCTURE_NOTIFY;

}  // namespace

std::unique_ptr<CaptureTarget> CaptureTarget::open(X11Connection& connection, xcb_window_t window, Kind kind) {
    const Owned<xcb_get_geometry_reply_t> geometry(
        xcb_get_geometry_reply(connection.get(), xcb_get_geometry(connection.get(), window), nullptr));
    if (!geometry || (geometry->depth != 24 && geometry->depth != 32)) return nullptr;
    std::unique_ptr<CaptureTarget> target(new CaptureTarget(connection, window, kind));
    target->begin();
    return target;
}

CaptureTarget::CaptureTarget(X11Connection& connection, xcb_window_t window, Kind kind)
    : connection_(connection),
      window_(window),
      kind_(kind),
      damage_(xcb_generate_id(connection.get())),
      region_(xcb_generate_id(connection.get())) {}

CaptureTarget::~CaptureTarget() {
    xcb_connection_t* const x = connection_.get();
    freePixmap();
    xcb_xfixes_destroy_region(x, region_);
    if (!gone_) {
        const std::uint32_t none = 0;
        xcb_damage_destroy(x, damage_);
        xcb_change_window_attributes(x, window_, XCB_CW_EVENT_MASK, &none);
        if (kind_ == Kind::Window) xcb_composite_unredirect_window(x, window_, XCB_COMPOSITE_REDIRECT_AUTOMATIC);
    }
    xcb_flush(x);
}

void CaptureTarget::begin() {
    xcb_connection_t* const x = connection_.get();
    const std::uint32_t events = kind_ == Kind::Window ? kWindowEvents : kScreenEvents;
    xcb_change_window_attributes(x, window_, XCB_CW_EVENT_MASK, &events);
    if (kind_ == Kind::Window) xcb_composite_redirect_window(x, window_, XCB_COMPOSITE_REDIRECT_AUTOMATIC);
    xcb_damage_create(x, damage_, window_, XCB_DAMAGE_REPORT_LEVEL_NON_EMPTY);
    xcb_xfixes_create_region(x, region_, 0, nullptr);
    refresh();
}

void CaptureTarget::handle(const xcb_generic_event_t& event, std::int64_t now) {
    const int type = event.response_type & 0x7F;
    if (type == connection_.firstDamageEvent() + XCB_DAMAGE_NOTIFY) {
        const auto& damage = reinterpret_cast<const xcb_damage_notify_event_t&>(event);
        // One that was sent before the last subtraction is answered by it.
        if (damage.damage != damage_ || before(event.full_sequence, subtracted_)) return;
        damaged_ = true;
        damagedAfter_ = event.full_sequence;
    } else if (type == XCB_EXPOSE) {
        const auto& expose = reinterpret_cast<const xcb_expose_event_t&>(event);
        if (expose.window == window_) exposed(expose, now);
    } else if (type == XCB_CONFIGURE_NOTIFY) {
        const auto& configure = reinterpret_cast<const xcb_configure_notify_event_t&>(event);
        if (configure.window == window_) resized(configure);
    } else if (type == XCB_UNMAP_NOTIFY) {
        if (reinterpret_cast<const xcb_unmap_notify_event_t&>(event).window != window_) return;
        freePixmap();
        needsRefresh_ = false;
        awaited_.clear();
    } else if (type == XCB_MAP_NOTIFY) {
        needsRefresh_ |= reinterpret_cast<const xcb_map_notify_event_t&>(event).window == window_;
    } else if (type == XCB_VISIBILITY_NOTIFY) {
        // A redirected window hides and comes back with its parent; this is all that tells.
        needsRefresh_ |= reinterpret_cast<const xcb_visibility_notify_event_t&>(event).window == window_;
    } else if (type == XCB_REPARENT_NOTIFY) {
        needsRefresh_ |= reinterpret_cast<const xcb_reparent_notify_event_t&>(event).window == window_;
    } else if (type == XCB_DESTROY_NOTIFY) {
        gone_ |= reinterpret_cast<const xcb_destroy_notify_event_t&>(event).window == window_;
    }
}

void CaptureTarget::exposed(const xcb_expose_event_t& event, std::int64_t now) {
    if (awaited_.empty()) {
        repaintDeadline_ = now + kRepaintPatience;
        painted_.clear();
    }
    awaited_.add(PixelRect{event.x, event.y, event.width, event.height});
}

// A move needs nothing: the picture is the window's own.
void CaptureTarget::resized(const xcb_configure_notify_event_t& event) {
    if ((event.response_type & 0x80) != 0) return;  // sent by a window manager, about the place on the screen
    needsRefresh_ |= event.width != width_ || event.height != height_ || event.border_width != border_;
}

void CaptureTarget::freePixmap() {
    if (drawable_ != XCB_NONE && kind_ == Kind::Window) xcb_free_pixmap(connection_.get(), drawable_);
    drawable_ = XCB_NONE;
}

void CaptureTarget::refresh() {
    needsRefresh_ = false;
    freePixmap();
    if (kind_ == Kind::Window)
        nameWindow();
    else
        measureScreen();
    // Everything is read anyway.
    damaged_ = readable();
    ++layout_;
}

void CaptureTarget::nameWindow() {
    xcb_connection_t* const x = connection_.get();
    const xcb_pixmap_t pixmap = xcb_generate_id(x);
    const auto nameCookie = xcb_composite_name_window_pixmap_checked(x, window_, pixmap);
    // The pixmap's own size: the window's may be another one by the time it is asked for.
    const auto pixmapCookie = xcb_get_geometry(x, pixmap);
    subtracted_ = xcb_damage_subtract(x, damage_, XCB_NONE, XCB_NONE).sequence;
    const auto windowCookie = xcb_get_geometry(x, window_);
    const bool named = connection_.succeeded(nameCookie);
    const Owned<xcb_get_geometry_reply_t> size(xcb_get_geometry_reply(x, pixmapCookie, nullptr));
    Owned<xcb_generic_error_t> error;
    xcb_generic_error_t* raw = nullptr;
    const Owned<xcb_get_geometry_reply_t> window(xcb_get_geometry_reply(x, windowCookie, &raw));
    error.reset(raw);
    if (error) gone_ = true;
    if (!named || !size || !window) return;
    const std::int32_t border = window->border_width;
    if (size->width <= 2 * border || size->height <= 2 * border) {
        xcb_free_pixmap(x, pixmap);
        return;
    }
    drawable_ = pixmap;
    border_ = border;
    width_ = size->width - 2 * border;
    height_ = size->height - 2 * border;
}

void CaptureTarget::measureScreen() {
    xcb_connection_t* const x = connection_.get();
    subtracted_ = xcb_damage_subtract(x, damage_, XCB_NONE, XCB_NONE).sequence;
    const Owned<xcb_get_geometry_reply_t> size(xcb_get_geometry_reply(x, xcb_get_geometry(x, window_), nullptr));
    if (!size) return;
    drawable_ = window_;
    width_ = size->width;
    height_ = size->height;
}

void CaptureTarget::takeDamage(DamageRegion& into) {
    xcb_connection_t* const x = connection_.get();
    subtracted_ = xcb_damage_subtract(x, damage_, XCB_NONE, region_).sequence;
    damaged_ = false;
    const Owned<xcb_xfixes_fetch_region_reply_t> region(
        xcb_xfixes_fetch_region_reply(x, xcb_xfixes_fetch_region(x, region_), nullptr));
    if (!region) return;
    const xcb_rectangle_t* const rects = xcb_xfixes_fetch_region_rectangles(region.get());
    const int count = xcb_xfixes_fetch_region_rectangles_length(region.get());
    DamageRegion changed;
    for (int i = 0; i < count; ++i) changed.add(PixelRect{rects[i].x, rects[i].y, rects[i].width, rects[i].height});
    into.add(changed);
    if (awaited_.empty()) return;
    painted_.add(changed);
    const auto awaited = awaited_.rects();
    if (std::all_of(awaited.begin(), awaited.end(), [&](const PixelRect& rect) { return painted_.covers(rect); }))
        awaited_.clear();
}

bool CaptureTarget::read(const SharedMemory& memory, std::span<const Strip> strips) {
    xcb_connection_t* const x = connection_.get();
    const std::size_t rowBytes = static_cast<std::size_t>(width_) * 4;
    std::array<xcb_shm_get_image_cookie_t, DamageRegion::kMaximumRects> cookies;
    const std::size_t count = std::min(strips.size(), cookies.size());
    for (std::size_t i = 0; i < count; ++i) {
        const Strip& strip = strips[i];
        cookies[i] = xcb_shm_get_image(x, drawable_, static_cast<std::int16_t>(border_),
                                       static_cast<std::int16_t>(border_ + strip.y), static_cast<std::uint16_t>(width_),
                                       static_cast<std::uint16_t>(strip.height), ~0u, XCB_IMAGE_FORMAT_Z_PIXMAP,
                                       memory.segment(),
                                       static_cast<std::uint32_t>(static_cast<std::size_t>(strip.y) * rowBytes));
        lastRead_ = cookies[i].sequence;
    }
    bool complete = count == strips.size();
    for (std::size_t i = 0; i < count; ++i)
        complete &= Owned<xcb_shm_get_image_reply_t>(xcb_shm_get_image_reply(x, cookies[i], nullptr)) != nullptr;
    needsRefresh_ |= !complete;
    return complete;
}

bool CaptureTarget::overtaken() const { return damaged_ && before(damagedAfter_, lastRead_); }

}  // namespace lumacast::x11
