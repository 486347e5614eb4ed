#pragma once
// Several captured windows as one picture.

#include <xcb/xcb.h>

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "linux/display/Arrangement.h"
#include "linux/display/CaptureTarget.h"
#include "linux/display/PictureSource.h"
#include "linux/display/WindowTree.h"

namespace lumacast::x11 {

/// The part of the screen around all the windows, with nothing but them on it, each where it is and above those that it
/// covers, black in between. The display server puts it together in a picture of its own, out of the windows' pictures;
/// only what has changed is copied there, or everything when a window came, went, moved or changed its place in the
/// order. A window that is hidden keeps its place until it is shown again; one that was never shown has none. Belongs
/// to the frame lane.
class Canvas final : public PictureSource {
public:
    explicit Canvas(X11Connection& connection);
    ~Canvas() override;
    Canvas(const Canvas&) = delete;
    Canvas& operator=(const Canvas&) = delete;

    /// The windows to show from now on, borrowed. They get their events from the caller, and are not to be read by
    /// anybody else.
    void show(std::vector<CaptureTarget*> targets);
    /// Takes note of what an event says about the arrangement.
    void handle(const xcb_generic_event_t& event);

    std::uint32_t id() const override { return context_; }
    bool needsRefresh() const override;
    void refresh() override;
    bool readable() const override { return picture_ != XCB_NONE; }
    std::int32_t width() const override { return arranged_.box.width; }
    std::int32_t height() const override { return arranged_.box.height; }
    std::uint64_t layout() const override { return layout_; }
    bool damaged() const override;
    void takeDamage(DamageRegion& into) override;
    /// Of several windows that are waited for, the first one's.
    std::int64_t repaintDeadline() const override;
    void repaintIsLate(std::int64_t now) override;
    bool read(const SharedMemory& memory, std::span<const Strip> strips) override;
    bool overtaken() const override;

private:
    Arrangement arrange();
    void makePicture(std::int32_t width, std::int32_t height);
    void freePicture();
    void addDamage(std::size_t part, const PixelRect& onScreen, DamageRegion& into);
    void compose(const PixelRect& rect);
    void copy(const Arrangement::Part& part, const PixelRect& onScreen);
    void copyOtherDepth(CaptureTarget& target, const xcb_rectangle_t& from, std::int16_t toX, std::int16_t toY);
    template <class Do>
    void forEachVisible(Do&& act) const;

    X11Connection& connection_;
    WindowTree tree_;
    const xcb_gcontext_t context_;  ///< made with the first picture
    bool contextMade_ = false;
    xcb_pixmap_t picture_ = XCB_NONE;
    std::vector<CaptureTarget*> targets_;
    Arrangement arranged_;
    bool arrangementIsStale_ = true;
    std::uint64_t layout_ = 0;
    DamageRegion stale_;  ///< of the picture, not composed yet
    std::optional<SharedMemory> detour_;
    std::uint32_t lastCopy_ = 0;
};

}  // namespace lumacast::x11
