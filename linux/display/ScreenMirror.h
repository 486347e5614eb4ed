#pragma once
// The whole screen as its user sees it.

#include <xcb/xcb.h>

#include <cstdint>
#include <memory>

#include "linux/display/BlankWatch.h"
#include "linux/display/CaptureTarget.h"
#include "linux/display/PictureSource.h"
#include "linux/display/Pointer.h"

namespace lumacast::x11 {

/// The root window, that is all monitors together, with the pointer over it. Changes of its size come as those of any
/// picture. Belongs to the frame lane.
class ScreenMirror final : public PictureSource {
public:
    /// A pointer that has rested this long is looked after less often: so late, at most, its next move is seen.
    static constexpr std::int64_t kRest = 1'000'000'000, kRestInterval = 50'000'000;

    /// Null when the screen's pixels aren't 32 bits wide. The pointer is looked after `interval` nanoseconds apart. The
    /// connection must outlive the mirror.
    static std::unique_ptr<ScreenMirror> open(X11Connection& connection, std::int64_t interval);

    /// Takes note of what an event says about the screen.
    void handle(const xcb_generic_event_t& event, std::int64_t now);
    /// Asks anew whether the screen is blank; waits for the server.
    void lookWhetherBlank(std::int64_t now) { blank_.look(now); }
    /// The screen is locked or dark.
    bool blank() const { return blank_.blank(); }

    std::uint32_t id() const override { return screen_->id(); }
    bool needsRefresh() const override { return screen_->needsRefresh(); }
    void refresh() override { screen_->refresh(); }
    bool readable() const override { return screen_->readable(); }
    std::int32_t width() const override { return screen_->width(); }
    std::int32_t height() const override { return screen_->height(); }
    std::uint64_t layout() const override { return screen_->layout(); }
    std::int64_t nextLook() const override;
    /// Where the screen itself gives steady pictures they bring the pointer along: it isn't looked after besides.
    void look(std::int64_t now) override;
    Overlay overlay() const override { return pointer_.drawn(); }
    bool damaged() const override { return screen_->damaged() || pointer_.changed(); }
    void takeDamage(DamageRegion& into) override;
    std::int64_t repaintDeadline() const override { return 0; }
    void repaintIsLate(std::int64_t) override {}
    bool read(const SharedMemory& memory, std::span<const Strip> strips) override {
        return screen_->read(memory, strips);
    }
    bool overtaken() const override { return screen_->overtaken(); }

private:
    ScreenMirror(X11Connection& connection, std::unique_ptr<CaptureTarget> screen, std::int64_t interval);

    const std::unique_ptr<CaptureTarget> screen_;
    Pointer pointer_;
    BlankWatch blank_;
    const std::int64_t interval_;
    std::int64_t nextPointerLook_ = 0;
    std::int64_t pointerMoved_ = 0;
    // Since the last look().
    bool pictureCameAlong_ = false;
    bool moved_ = false;
};

}  // namespace lumacast::x11
