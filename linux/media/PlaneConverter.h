#pragma once
#include <cstdint>
#include <memory>
#include <optional>

#include "linux/media/I420Picture.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast::media {

/// Turns captured planes (BGRX) into planar pictures of one size (BT.601, limited range), touching only what changed:
/// the damaged rectangles where a plane directly follows the one converted before, everything otherwise. A plane of
/// another size is scaled to the track's; one that is a pixel short of the even size is extended by its edge instead,
/// so that text stays sharp. Not thread-safe: it belongs to one encoder's thread. Allocates only when the source's size
/// changes.
class PlaneConverter final {
public:
    /// The pictures' size; even numbers.
    PlaneConverter(int width, int height);

    /// The plane's picture; valid and unchanging until the next call. Null for a plane whose memory is smaller than its
    /// size says; the picture before then stays as it is.
    const std::shared_ptr<I420Picture>& convert(const SharedPlane& plane);

    /// Pixels converted so far, for measurements and tests.
    std::uint64_t convertedPixels() const { return convertedPixels_; }

private:
    bool follows(const SharedPlane& plane) const;
    void convertRect(const SharedPlane& plane, PixelRect rect, I420Picture& into);
    bool convertDamage(const SharedPlane& plane, I420Picture& into);

    const std::shared_ptr<I420Picture> nothing_;
    const std::shared_ptr<I420Picture> target_;
    std::unique_ptr<I420Picture> unscaled_;  ///< the source's own size, while that is not the target's
    std::int32_t sourceWidth_ = 0, sourceHeight_ = 0;
    std::optional<std::uint64_t> lastNumber_;
    std::uint64_t convertedPixels_ = 0;
};

}  // namespace lumacast::media
