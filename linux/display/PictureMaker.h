#pragma once
// Makes planes of the frame's size out of a changing picture.

#include <array>
#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

#include "base/Recycler.h"
#include "linux/display/DamageTracker.h"
#include "linux/display/Fit.h"
#include "linux/display/PictureSource.h"
#include "linux/display/PlanePool.h"

namespace lumacast::x11 {

/// Reads from a target into planes, only what changed since each plane's own picture. Where picture and frame have one
/// size the display server writes straight into the plane; else, and where something is drawn over the picture, into an
/// image of it, from which the plane is copied, scaled or turned. Belongs to the frame lane. Waits for the server while
/// reading.
class PictureMaker final {
public:
    /// Pictures of this size; the connection must outlive the maker.
    PictureMaker(X11Connection& connection, std::int32_t width, std::int32_t height);
    ~PictureMaker();
    PictureMaker(const PictureMaker&) = delete;
    PictureMaker& operator=(const PictureMaker&) = delete;

    bool makes(std::int32_t width, std::int32_t height) const {
        return pool_.width() == width && pool_.height() == height;
    }
    /// The target to read from now on, or its new layout, or another turn: everything has changed.
    void follow(const PictureSource& target, Turn turn);
    /// Whether follow() was last called for this target as it is laid out now, and this turn.
    bool follows(const PictureSource& target, Turn turn) const {
        return source_ == target.id() && layout_ == target.layout() && fit_.turn == turn;
    }
    /// How the picture lies in the frame.
    Turn turn() const { return fit_.turn; }
    /// This part of the target's picture has changed.
    void add(const DamageRegion& damage);
    /// The next picture goes to somebody who has seen none.
    void startOver() { tracker_.nothingDelivered(); }
    bool somethingNew() const { return !tracker_.sinceDelivery().empty(); }

    /// Whether this plane holds pictures just as they were read.
    bool isDirect(const Plane& plane) const;

    /// A plane nobody holds; none when all are held.
    std::optional<std::size_t> acquire();
    /// Brings a plane up to date. False when the server would not, or there is no memory.
    bool update(std::size_t plane, PictureSource& target);
    /// The plane as a picture with this number.
    std::shared_ptr<Picture> picture(std::size_t plane, std::uint64_t number);
    /// A picture was delivered: the next one's damage counts from it.
    void delivered() { tracker_.delivered(); }
    /// From time to time: gives planes back that nobody has needed for some seconds, as after a moment in which the
    /// machine was busy. Nanoseconds of the steady clock.
    void tidy(std::int64_t now);

private:
    bool updateDirectly(std::size_t plane, PictureSource& target);
    bool updateFromImage(std::size_t plane, PictureSource& target);
    bool readImage(PictureSource& target);
    void draw(const Overlay& overlay);
    void show(const PixelRect& rect, Plane& plane);
    void scale(const PixelRect& rect, std::uint8_t* frame, int stride) const;

    X11Connection& connection_;
    PlanePool pool_;
    DamageTracker tracker_;
    std::uint32_t source_ = 0;
    std::uint64_t layout_ = 0;
    Fit fit_;
    std::array<Fit, kPlanes> planeFits_{};  ///< what each plane's borders were cleared for
    std::array<bool, kPlanes> needed_{};    ///< since the last tidying
    std::int64_t nextTidying_ = 0;
    std::optional<SharedMemory> image_;     ///< the target's picture, where it doesn't go straight into the plane
    DamageRegion imageStale_;
    PixelRect drawnOver_;               ///< of the image
    Recycler<Picture> pictures_;
    std::vector<std::uint8_t> scaled_;  ///< an upright frame, where it is scaled before it is turned
};

}  // namespace lumacast::x11
