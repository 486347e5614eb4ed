#pragma once
// What a frame lane reads pictures from.

#include <xcb/xcb.h>

#include <cstdint>
#include <limits>
#include <span>

#include "linux/display/DamageRegion.h"
#include "linux/display/ReadRows.h"
#include "linux/display/SharedMemory.h"

namespace lumacast::x11 {

/// What is drawn over a picture after it was read: pixels of its own, 0xAARRGGBB, their colours multiplied by their
/// alpha already, row by row. Parts of it may lie outside the picture. Empty where there is nothing to draw.
struct Overlay {
    PixelRect place;
    std::span<const std::uint32_t> pixels;  ///< borrowed from who gives the overlay
};

/// A changing picture that the display server keeps: one window's, the screen's, or several windows' put together.
/// Belongs to one thread; `refresh`, `look`, `takeDamage` and `read` wait for the server. Times are nanoseconds of the
/// steady clock.
class PictureSource {
public:
    virtual ~PictureSource() = default;

    /// Which source it is: no two of a connection have the same.
    virtual std::uint32_t id() const = 0;

    /// The picture must be asked for anew: it has another size, or what it is made of came, went or moved.
    virtual bool needsRefresh() const = 0;
    /// restore() must follow, once the events that came with the answers were handled: nobody may paint until then.
    virtual void refresh() = 0;
    /// `last` is the picture that was shown last, in rows of width() pixels with nothing between them: what the server
    /// has lost of the picture is taken from there. Null where there is none.
    virtual void restore(const SharedMemory* /*last*/) {}
    /// Whether there is a picture to read now.
    virtual bool readable() const = 0;
    virtual std::int32_t width() const = 0;
    virtual std::int32_t height() const = 0;
    /// Another number whenever the whole picture has to be read anew.
    virtual std::uint64_t layout() const = 0;

    /// When to look() next, for what the server tells nobody; never for most.
    virtual std::int64_t nextLook() const { return std::numeric_limits<std::int64_t>::max(); }
    virtual void look(std::int64_t /*now*/) {}
    /// What to draw over what was read; takeDamage tells of its changes too.
    virtual Overlay overlay() const { return {}; }

    /// Something has changed since takeDamage.
    virtual bool damaged() const = 0;
    /// Adds what has changed; from then on only what changes later counts.
    virtual void takeDamage(DamageRegion& into) = 0;
    /// Until when to wait for an application to paint what the server uncovered; 0 when there is nothing to wait for.
    virtual std::int64_t repaintDeadline() const = 0;
    /// The deadline has passed.
    virtual void repaintIsLate(std::int64_t now) = 0;

    /// Copies rows of the picture into `memory`, each where it is in a picture with rows of width() pixels and nothing
    /// between them. False when the server would not; then the picture needs a refresh.
    virtual bool read(const SharedMemory& memory, std::span<const Strip> strips) = 0;
    /// The picture changed before the last read was over, so that it may show parts of two.
    virtual bool overtaken() const = 0;
    /// What was read last may show others' pixels, and is not to be used.
    virtual bool spoilt() const { return false; }
};

}  // namespace lumacast::x11
