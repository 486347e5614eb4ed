#pragma once
// The X11 side of capturing one window, or the screen.

#include <xcb/xcb.h>
#include <xcb/xfixes.h>

#include <cstdint>
#include <memory>
#include <span>

#include "linux/display/DamageRegion.h"
#include "linux/display/SharedMemory.h"
#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// Rows of a window, over its full width.
struct Strip {
    std::int32_t y = 0, height = 0;
};

/// A window that is captured, whatever covers it: the server keeps its picture in memory of its own (automatic
/// redirection), reports what changes in it, and copies what is asked for. Or the whole screen, as it is shown, without
/// the pointer. Belongs to one thread; `refresh`, `takeDamage` and `read` wait for the server. Times are nanoseconds of
/// the steady clock.
class CaptureTarget final {
public:
    enum class Kind { Window, Screen };
    /// How long an application may take to repaint what the server uncovered before its picture is taken as it is.
    static constexpr std::int64_t kRepaintPatience = 100'000'000;

    /// Null when there is no such window, or its pixels aren't 32 bits wide. The connection must outlive the target.
    static std::unique_ptr<CaptureTarget> open(X11Connection& connection, xcb_window_t window, Kind kind);
    ~CaptureTarget();
    CaptureTarget(const CaptureTarget&) = delete;
    CaptureTarget& operator=(const CaptureTarget&) = delete;

    xcb_window_t window() const { return window_; }
    Kind kind() const { return kind_; }
    /// Takes note of what an event says about this target.
    void handle(const xcb_generic_event_t& event, std::int64_t now);

    /// The window was destroyed.
    bool gone() const { return gone_; }
    /// Its picture must be asked for anew: its size changed, or it came back.
    bool needsRefresh() const { return needsRefresh_; }
    void refresh();
    /// Whether there is a picture to read now: not while the window is hidden.
    bool readable() const { return drawable_ != XCB_NONE; }
    /// The picture's size, without the window's border; another number in layout() with each refresh.
    std::int32_t width() const { return width_; }
    std::int32_t height() const { return height_; }
    std::uint64_t layout() const { return layout_; }

    /// Something has changed since takeDamage.
    bool damaged() const { return damaged_; }
    /// Adds what has changed; from then on only what changes later counts.
    void takeDamage(DamageRegion& into);
    /// Until when to wait for the application to paint what the server uncovered; 0 when there is nothing to wait for.
    std::int64_t repaintDeadline() const { return awaited_.empty() ? 0 : repaintDeadline_; }
    /// The deadline has passed. What the server uncovered may still show other windows' pixels; once, that is painted
    /// over and the application asked again, with another deadline. The second time the picture is taken as it is.
    void repaintIsLate(std::int64_t now);

    /// Copies rows of the picture into `memory`, each where it is in a picture with rows of width() pixels and nothing
    /// between them. False when the server would not; then the picture needs a refresh.
    bool read(const SharedMemory& memory, std::span<const Strip> strips);
    /// The picture changed before the last read was over, so that it may show parts of two.
    bool overtaken() const;

private:
    CaptureTarget(X11Connection& connection, xcb_window_t window, Kind kind);
    void begin();
    void nameWindow();
    void measureScreen();
    void freePixmap();
    void forgetDamage();
    void exposed(const xcb_expose_event_t& event, std::int64_t now);
    DamageRegion unpainted() const;
    void paintOver(const DamageRegion& region);
    void resized(const xcb_configure_notify_event_t& event);

    X11Connection& connection_;
    const xcb_window_t window_;
    const Kind kind_;
    bool gone_ = false;
    bool needsRefresh_ = true;
    bool damaged_ = false;
    std::uint32_t damage_ = 0;
    xcb_xfixes_region_t region_ = XCB_NONE;
    xcb_drawable_t drawable_ = XCB_NONE;
    std::int32_t width_ = 0, height_ = 0, border_ = 0;
    std::uint64_t layout_ = 0;

    DamageRegion awaited_;  ///< uncovered by the server, not painted yet
    DamageRegion painted_;
    bool foreign_ = false;  ///< the server made new memory for the picture, out of what was on the screen
    std::int64_t repaintDeadline_ = 0;

    // The server's numbers of our requests: they tell whether an event came before or after one.
    std::uint32_t subtracted_ = 0;
    std::uint32_t damagedAfter_ = 0;
    std::uint32_t lastRead_ = 0;
};

}  // namespace lumacast::x11
