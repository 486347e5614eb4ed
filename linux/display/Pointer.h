#pragma once
// The pointer, for a picture of the screen: the server leaves it out of what it lets others read.

#include <xcb/xcb.h>

#include <cstdint>
#include <vector>

#include "linux/display/DamageRegion.h"
#include "linux/display/PictureSource.h"
#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// Where the pointer is and what it looks like. The server tells when it takes another shape, not when it moves: that
/// has to be asked for. A pointer without a visible pixel is as good as none; one that another client has hidden can't
/// be told from a visible one. Belongs to one thread; `look` waits for the server.
class Pointer final {
public:
    /// The connection must outlive the pointer.
    explicit Pointer(X11Connection& connection);
    ~Pointer();
    Pointer(const Pointer&) = delete;
    Pointer& operator=(const Pointer&) = delete;

    void handle(const xcb_generic_event_t& event);
    /// Asks the server. Without an answer there is no pointer.
    void look();
    /// Whether it looks or lies otherwise than at the last take(), or is about to.
    bool changed() const;
    /// Adds where it was and where it is now, if it has changed.
    void take(DamageRegion& into);
    /// As it was taken.
    Overlay drawn() const;

private:
    struct Shape {
        std::int32_t width = 0, height = 0, hotX = 0, hotY = 0;
        std::vector<std::uint32_t> pixels;  ///< none when nothing of it is visible
    };
    void readShape();
    PixelRect place() const;

    X11Connection& connection_;
    std::uint8_t firstEvent_ = 0;
    bool shapeIsStale_ = true;
    bool shapeIsNew_ = true;
    bool onScreen_ = false;
    std::int32_t x_ = 0, y_ = 0;
    Shape shape_;
    PixelRect drawn_;
};

}  // namespace lumacast::x11
