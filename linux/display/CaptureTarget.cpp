#include "linux/display/CaptureTarget.h"

#include <xcb/composite.h>
#include <xcb/damage.h>
#include <xcb/shm.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <limits>
#include <utility>

#include "linux/display/Covering.h"

namespace lumacast::x11 {
namespace {

constexpr std::uint32_t kWindowEvents =
    XCB_EVENT_MASK_STRUCTURE_NOTIFY | XCB_EVENT_MASK_EXPOSURE | XCB_EVENT_MASK_VISIBILITY_CHANGE;
constexpr std::uint32_t kScreenEvents = XCB_EVENT_MASK_STRUCTURE_NOTIFY;
// A window that was redirected a moment ago may be covered again in the next: menus and messages come and go.
constexpr std::int64_t kFirstLookAfter = 1'000'000'000, kLastLookAfter = 4'000'000'000;
// What was painted as a whole so often in a row is taken to be so again; each so-many-th time the server is asked.
constexpr std::uint32_t kWholeBefore = 4, kAskAgain = 8;
constexpr std::int64_t kNever = std::numeric_limits<std::int64_t>::max();

}  // namespace

std::unique_ptr<CaptureTarget> CaptureTarget::open(X11Connection& connection, xcb_window_t window, Kind kind) {
    const Owned<xcb_get_geometry_reply_t> geometry(
        xcb_get_geometry_reply(connection.get(), xcb_get_geometry(connection.get(), window), nullptr));
    if (!geometry || (geometry->depth != 24 && geometry->depth != 32)) return nullptr;
    std::unique_ptr<CaptureTarget> target(new CaptureTarget(connection, window, kind, geometry->depth));
    target->begin(geometry->width, geometry->height);
    return target;
}

CaptureTarget::CaptureTarget(X11Connection& connection, xcb_window_t window, Kind kind, std::uint8_t depth)
    : connection_(connection),
      window_(window),
      kind_(kind),
      depth_(depth),
      damage_(xcb_generate_id(connection.get())),
      region_(xcb_generate_id(connection.get())) {}

CaptureTarget::~CaptureTarget() {
    xcb_connection_t* const x = connection_.get();
    if (leavesScreen_) xcb_ungrab_server(x);
    freePixmap();
    xcb_xfixes_destroy_region(x, region_);
    if (!gone_) {
        const std::uint32_t none = 0;
        xcb_damage_destroy(x, damage_);
        xcb_change_window_attributes(x, window_, XCB_CW_EVENT_MASK, &none);
        if (kind_ == Kind::Window && !fromScreen_) xcb_composite_unredirect_window(x, window_, XCB_COMPOSITE_REDIRECT_AUTOMATIC);
    }
    xcb_flush(x);
}

void CaptureTarget::begin(std::uint16_t width, std::uint16_t height) {
    xcb_connection_t* const x = connection_.get();
    const std::uint32_t events = kind_ == Kind::Window ? kWindowEvents : kScreenEvents;
    xcb_change_window_attributes(x, window_, XCB_CW_EVENT_MASK, &events);
    if (kind_ == Kind::Window) xcb_composite_redirect_window(x, window_, XCB_COMPOSITE_REDIRECT_AUTOMATIC);
    if (kind_ == Kind::Window) askForRepaint(width, height);
    xcb_damage_create(x, damage_, window_, XCB_DAMAGE_REPORT_LEVEL_NON_EMPTY);
    xcb_xfixes_create_region(x, region_, 0, nullptr);
    refresh();
}

/// What had covered the window until a moment ago is still in its picture where the server paints no background: the
/// server has asked for a repaint then and does not again. So the application is asked here, in the server's words; the
/// event comes to this client too, and what it names is waited for as what the server uncovers is.
void CaptureTarget::askForRepaint(std::uint16_t width, std::uint16_t height) {
    xcb_expose_event_t event{};
    event.response_type = XCB_EXPOSE;
    event.window = window_;
    event.width = width;
    event.height = height;
    static_assert(sizeof event <= 32);
    std::array<char, 32> sent{};
    std::memcpy(sent.data(), &event, sizeof event);
    xcb_send_event(connection_.get(), 0, window_, XCB_EVENT_MASK_EXPOSURE, sent.data());
    asksForRepaint_ = true;
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
        awaitNothing();
    } else if (type == XCB_MAP_NOTIFY) {
        needsRefresh_ |= reinterpret_cast<const xcb_map_notify_event_t&>(event).window == window_;
    } else if (type == XCB_VISIBILITY_NOTIFY) {
        // A redirected window hides and comes back with its parent; this is all that tells. On the screen it tells that
        // the window is covered, before anything that is read then is answered.
        const auto& visibility = reinterpret_cast<const xcb_visibility_notify_event_t&>(event);
        if (visibility.window != window_) return;
        needsRefresh_ = true;
        covered_ |= visibility.state != XCB_VISIBILITY_UNOBSCURED;
    } else if (type == XCB_REPARENT_NOTIFY) {
        needsRefresh_ |= reinterpret_cast<const xcb_reparent_notify_event_t&>(event).window == window_;
    } else if (type == XCB_DESTROY_NOTIFY) {
        gone_ |= reinterpret_cast<const xcb_destroy_notify_event_t&>(event).window == window_;
    }
}

void CaptureTarget::exposed(const xcb_expose_event_t& event, std::int64_t now) {
    const bool isSent = (event.response_type & 0x80) != 0;
    // One by anybody else is between him and the application.
    if (isSent && !std::exchange(asksForRepaint_, false)) return;
    if (awaited_.empty()) {
        repaintDeadline_ = now + kRepaintPatience;
        painted_.clear();
    }
    const PixelRect rect{event.x, event.y, event.width, event.height};
    awaited_.add(rect);
    if (!isSent) uncovered_.add(rect);
}

void CaptureTarget::awaitNothing() {
    awaited_.clear();
    uncovered_.clear();
}

DamageRegion CaptureTarget::unpainted(const DamageRegion& region) const {
    DamageRegion left;
    for (const PixelRect& rect : region.rects()) {
        const PixelRect inside = intersection(rect, {0, 0, width_, height_});
        if (!painted_.covers(inside)) left.add(inside);
    }
    return left;
}

void CaptureTarget::repaintIsLate(std::int64_t now) {
    const DamageRegion left = unpainted(uncovered_);
    awaitNothing();
    if (!foreign_ || !readable() || left.empty()) return;
    foreign_ = false;
    awaited_ = left;
    paintOver(awaited_);
    painted_.clear();
    repaintDeadline_ = now + kRepaintPatience;
}

// Black in the picture itself, then the window's background where it has one, then the application's turn. Its damage
// from before says nothing any more: everything is read anew.
void CaptureTarget::paintOver(const DamageRegion& region) {
    xcb_connection_t* const x = connection_.get();
    const xcb_gcontext_t context = xcb_generate_id(x);
    const std::uint32_t black = 0;
    xcb_create_gc(x, context, drawable_, XCB_GC_FOREGROUND, &black);
    for (const PixelRect& rect : region.rects()) {
        const auto width = static_cast<std::uint16_t>(rect.width), height = static_cast<std::uint16_t>(rect.height);
        const auto left = static_cast<std::int16_t>(rect.x), top = static_cast<std::int16_t>(rect.y);
        const xcb_rectangle_t inPixmap{static_cast<std::int16_t>(rect.x + border_),
                                       static_cast<std::int16_t>(rect.y + border_), width, height};
        xcb_poly_fill_rectangle(x, drawable_, context, 1, &inPixmap);
        xcb_clear_area(x, 1, window_, left, top, width, height);
    }
    xcb_free_gc(x, context);
    forgetDamage();
    xcb_flush(x);
    damaged_ = true;
    ++layout_;
}

// A move needs nothing: the picture is the window's own.
void CaptureTarget::resized(const xcb_configure_notify_event_t& event) {
    if ((event.response_type & 0x80) != 0) return;  // sent by a window manager, about the place on the screen
    needsRefresh_ |= event.width != width_ || event.height != height_ || event.border_width != border_;
}

void CaptureTarget::freePixmap() {
    if (drawable_ != XCB_NONE && drawable_ != window_) xcb_free_pixmap(connection_.get(), drawable_);
    drawable_ = XCB_NONE;
}

void CaptureTarget::refresh() {
    needsRefresh_ = false;
    if (fromScreen_) leaveScreen();
    freePixmap();
    if (kind_ == Kind::Window)
        nameWindow();
    else
        measureScreen();
    // Everything is read anyway.
    damaged_ = readable();
    foreign_ = kind_ == Kind::Window;
    ++layout_;
    nextLook_ = 0;
}

void CaptureTarget::forgetDamage() {
    subtracted_ = xcb_damage_subtract(connection_.get(), damage_, XCB_NONE, XCB_NONE).sequence;
}

// With a redirection, in one go, what the server itself painted is forgotten, so that the application's own
// painting is waited for. Later, at a change of size, the application may have been faster than this, and its painting
// must count.
void CaptureTarget::nameWindow() {
    xcb_connection_t* const x = connection_.get();
    const xcb_pixmap_t pixmap = xcb_generate_id(x);
    const auto nameCookie = xcb_composite_name_window_pixmap_checked(x, window_, pixmap);
    // The pixmap's own size: the window's may be another one by the time it is asked for.
    const auto pixmapCookie = xcb_get_geometry(x, pixmap);
    if (std::exchange(redirectedNow_, false)) forgetDamage();
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
    const Owned<xcb_get_geometry_reply_t> size(xcb_get_geometry_reply(x, xcb_get_geometry(x, window_), nullptr));
    if (!size) return;
    drawable_ = window_;
    width_ = size->width;
    height_ = size->height;
}

// Films and games paint everything each time: not to ask what has changed spares a wait for the server with each of
// their pictures. When they cease to, some more pictures are read as a whole. An application that is waited for is not
// taken at its word.
bool CaptureTarget::takesForWhole() const {
    return damaged_ && awaited_.empty() && wholeInARow_ >= kWholeBefore && wholeInARow_ % kAskAgain != 0;
}

void CaptureTarget::takeDamage(DamageRegion& into) {
    into.add(carried_);
    carried_.clear();
    const PixelRect whole{0, 0, width_, height_};
    if (takesForWhole()) {
        forgetDamage();
        damaged_ = false;
        ++wholeInARow_;
        return into.add(whole);
    }
    xcb_connection_t* const x = connection_.get();
    subtracted_ = xcb_damage_subtract(x, damage_, XCB_NONE, region_).sequence;
    damaged_ = false;
    const Owned<xcb_xfixes_fetch_region_reply_t> region(
        xcb_xfixes_fetch_region_reply(x, xcb_xfixes_fetch_region_unchecked(x, region_), nullptr));
    if (!region) return;
    const xcb_rectangle_t* const rects = xcb_xfixes_fetch_region_rectangles(region.get());
    const int count = xcb_xfixes_fetch_region_rectangles_length(region.get());
    DamageRegion changed;
    for (int i = 0; i < count; ++i) changed.add(PixelRect{rects[i].x, rects[i].y, rects[i].width, rects[i].height});
    into.add(changed);
    wholeInARow_ = changed.covers(whole) ? wholeInARow_ + 1 : 0;
    if (awaited_.empty()) return;
    painted_.add(changed);
    if (unpainted(awaited_).empty()) awaitNothing();
}

void CaptureTarget::allowScreen(bool allowed) {
    if (kind_ != Kind::Window) return;
    mayReadScreen_ = allowed;
    needsRefresh_ |= fromScreen_ && !allowed;
}

std::int64_t CaptureTarget::nextLook() const {
    return mayReadScreen_ && !fromScreen_ && readable() ? nextLook_ : kNever;
}

/// Between the look at what covers the window and the end of the redirection nobody else may change it: of what covers
/// the window then, its picture would be overwritten.
void CaptureTarget::look(std::int64_t now) {
    const bool isFirst = nextLook_ == 0;
    lookAgainAfter_ = isFirst ? kFirstLookAfter : std::min(2 * lookAgainAfter_, kLastLookAfter);
    nextLook_ = now + lookAgainAfter_;
    if (isFirst || !mayReadScreen_ || fromScreen_ || !readable() || needsRefresh_ || !awaited_.empty()) return;
    xcb_connection_t* const x = connection_.get();
    xcb_grab_server(x);
    if (isWhollyShown(connection_, window_)) {
        DamageRegion damage;
        takeDamage(damage);
        carried_ = damage;
        damaged_ = !damage.empty();
        xcb_composite_unredirect_window(x, window_, XCB_COMPOSITE_REDIRECT_AUTOMATIC);
        forgetDamage();  // the server's own copying of the picture to the screen, where it is already
        freePixmap();
        drawable_ = window_;
        fromScreen_ = true;
        covered_ = false;
    }
    xcb_ungrab_server(x);
    xcb_flush(x);
}

// What the server puts into the picture of the window where it is covered is what covers it; then it asks the
// application to repaint that.
void CaptureTarget::leaveScreen() {
    xcb_grab_server(connection_.get());
    xcb_composite_redirect_window(connection_.get(), window_, XCB_COMPOSITE_REDIRECT_AUTOMATIC);
    fromScreen_ = covered_ = false;
    redirectedNow_ = leavesScreen_ = true;
}

// Own pixels, if of a moment ago, are better than waiting for those that the application will paint now.
void CaptureTarget::restore(const SharedMemory* last) {
    if (!std::exchange(leavesScreen_, false)) return;
    if (last && readable()) {
        for (const PixelRect& rect : uncovered_.rects()) putBack(*last, intersection(rect, {0, 0, width_, height_}));
        foreign_ = false;
        awaitNothing();
    }
    xcb_ungrab_server(connection_.get());
    xcb_flush(connection_.get());
}

void CaptureTarget::putBack(const SharedMemory& last, const PixelRect& rect) {
    if (isEmpty(rect)) return;
    xcb_connection_t* const x = connection_.get();
    const xcb_gcontext_t context = xcb_generate_id(x);
    xcb_create_gc(x, context, drawable_, 0, nullptr);
    xcb_shm_put_image(x, drawable_, context, static_cast<std::uint16_t>(width_), static_cast<std::uint16_t>(height_),
                      static_cast<std::uint16_t>(rect.x), static_cast<std::uint16_t>(rect.y),
                      static_cast<std::uint16_t>(rect.width), static_cast<std::uint16_t>(rect.height),
                      static_cast<std::int16_t>(rect.x + border_), static_cast<std::int16_t>(rect.y + border_), depth_,
                      XCB_IMAGE_FORMAT_Z_PIXMAP, 0, last.segment(), 0);
    xcb_free_gc(x, context);
}

bool CaptureTarget::read(const SharedMemory& memory, std::span<const Strip> strips) {
    // The picture in memory has the border around it.
    const std::int32_t inset = fromScreen_ ? 0 : border_;
    const RowsRead rows = readRows(connection_, drawable_, {inset, inset, width_, height_}, memory, strips);
    if (rows.lastRequest != 0) lastRead_ = rows.lastRequest;
    needsRefresh_ |= !rows.complete;
    return rows.complete;
}

}  // namespace lumacast::x11
