#pragma once
// The X11 side of capturing one window, or the screen.

#include <xcb/xcb.h>
#include <xcb/xfixes.h>

#include <cstdint>
#include <memory>
#include <span>

#include "linux/display/DamageRegion.h"
#include "linux/display/PictureSource.h"
#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// A window that is captured, whatever covers it: the server keeps its picture in memory of its own (automatic
/// redirection), reports what changes in it, and copies what is asked for. While nothing covers it, it may be read from
/// the screen, which spares the server that memory and the copying of each change to the screen. Or the whole screen, as
/// it is shown, without the pointer. There is no picture to read while the window is hidden; its size is without the
/// window's border.
class CaptureTarget final : public PictureSource {
public:
    enum class Kind { Window, Screen };
    /// How long an application may take to repaint what the server uncovered before its picture is taken as it is.
    static constexpr std::int64_t kRepaintPatience = 100'000'000;

    /// Null when there is no such window, or its pixels aren't 32 bits wide. The connection must outlive the target.
    static std::unique_ptr<CaptureTarget> open(X11Connection& connection, xcb_window_t window, Kind kind);
    ~CaptureTarget() override;
    CaptureTarget(const CaptureTarget&) = delete;
    CaptureTarget& operator=(const CaptureTarget&) = delete;

    xcb_window_t window() const { return window_; }
    Kind kind() const { return kind_; }
    /// Takes note of what an event says about this target.
    void handle(const xcb_generic_event_t& event, std::int64_t now);
    /// The window was destroyed.
    bool gone() const { return gone_; }

    /// Whether the window may be read from the screen: not when somebody copies from its picture within the server.
    void allowScreen(bool allowed);

    /// For whoever copies from the picture within the server: where it is while it is readable, and the pixels before
    /// its first column and row there.
    xcb_drawable_t drawable() const { return drawable_; }
    std::int32_t border() const { return border_; }
    std::uint8_t depth() const { return depth_; }
    /// Damaged already when the server got to this request of ours.
    bool damagedBefore(std::uint32_t request) const { return damaged_ && before(damagedAfter_, request); }

    std::uint32_t id() const override { return damage_; }  // the window may be captured a second time
    bool needsRefresh() const override { return needsRefresh_; }
    void refresh() override;
    std::int64_t nextLook() const override;
    void look(std::int64_t now) override;
    bool readable() const override { return drawable_ != XCB_NONE; }
    std::int32_t width() const override { return width_; }
    std::int32_t height() const override { return height_; }
    std::uint64_t layout() const override { return layout_; }
    bool damaged() const override { return damaged_; }
    void takeDamage(DamageRegion& into) override;
    std::int64_t repaintDeadline() const override { return awaited_.empty() ? 0 : repaintDeadline_; }
    /// What the server uncovered may still show other windows' pixels; once, that is painted over and the application
    /// asked again, with another deadline. The second time the picture is taken as it is, and so is what the application
    /// was only asked for.
    void repaintIsLate(std::int64_t now) override;
    bool read(const SharedMemory& memory, std::span<const Strip> strips) override;
    bool overtaken() const override { return damagedBefore(lastRead_); }
    bool spoilt() const override { return fromScreen_ && (covered_ || needsRefresh_); }
    void restore(const SharedMemory* last) override;

private:
    CaptureTarget(X11Connection& connection, xcb_window_t window, Kind kind, std::uint8_t depth);
    void begin(std::uint16_t width, std::uint16_t height);
    bool takesForWhole() const;
    void leaveScreen();
    void putBack(const SharedMemory& last, const PixelRect& rect);
    void nameWindow();
    void measureScreen();
    void freePixmap();
    void forgetDamage();
    void askForRepaint(std::uint16_t width, std::uint16_t height);
    void exposed(const xcb_expose_event_t& event, std::int64_t now);
    DamageRegion unpainted(const DamageRegion& region) const;
    void awaitNothing();
    void paintOver(const DamageRegion& region);
    void resized(const xcb_configure_notify_event_t& event);

    X11Connection& connection_;
    const xcb_window_t window_;
    const Kind kind_;
    const std::uint8_t depth_;
    bool gone_ = false;
    bool needsRefresh_ = true;
    bool damaged_ = false;
    std::uint32_t damage_ = 0;
    std::uint32_t wholeInARow_ = 0;  ///< how often all of it had changed, or was taken to have
    xcb_xfixes_region_t region_ = XCB_NONE;
    xcb_drawable_t drawable_ = XCB_NONE;
    std::int32_t width_ = 0, height_ = 0, border_ = 0;
    std::uint64_t layout_ = 0;

    bool mayReadScreen_ = false;
    bool fromScreen_ = false;     ///< it is not redirected
    bool redirectedNow_ = true;   ///< no picture of the redirected window was named yet
    bool covered_ = false;        ///< since it was read from the screen, in part at least
    bool leavesScreen_ = false;   ///< the server is held for it
    DamageRegion carried_;        ///< fetched, and not asked for yet
    std::int64_t nextLook_ = 0;   ///< 0: the first one is still to be planned
    std::int64_t lookAgainAfter_ = 0;

    DamageRegion awaited_;    ///< to be painted by the application, not painted yet
    DamageRegion uncovered_;  ///< what of it the server has uncovered
    bool asksForRepaint_ = false;  ///< until its own event comes back
    DamageRegion painted_;
    bool foreign_ = false;  ///< the server made new memory for the picture, out of what was on the screen
    std::int64_t repaintDeadline_ = 0;

    // The server's numbers of our requests: they tell whether an event came before or after one.
    std::uint32_t subtracted_ = 0;
    std::uint32_t damagedAfter_ = 0;
    std::uint32_t lastRead_ = 0;
};

}  // namespace lumacast::x11
