#pragma once

#include <cstdint>
#include <vector>

#include "examples/scene/Mark.h"
#include "examples/scene/Picture.h"

namespace lumacast::scene {

enum class Motion {
    Everywhere,  ///< every pixel of the background moves with every frame
    SmallPart,   ///< only a ball, the clock and the lowest bits of the frame number change
};

/// The local time of day that the scene shows as digits.
struct WallTime {
    int hour = 0;
    int minute = 0;
    int second = 0;
    int millisecond = 0;
};

/// A colourful moving scene with the time of day and the frame number in it. The picture is a pure function of size,
/// motion, number, time and mark. An object serves one size; use from one lane at a time.
class Scene final {
public:
    /// At least kMinimumWidth x kMinimumHeight; smaller values are raised to it.
    Scene(int width, int height, Motion motion);

    /// Draws frame `number` (its lowest 24 bits are readable by machine) and answers the rectangles that changed since
    /// this object's last drawing, which is everything for the first one. With Motion::SmallPart later drawings write
    /// only those, so the caller passes the same buffer each time; another buffer is drawn whole. The picture has this
    /// object's size.
    std::vector<Rect> draw(const Picture& picture, std::uint32_t number, const WallTime& time, Mark mark = Mark::None);

    [[nodiscard]] int width() const { return width_; }
    [[nodiscard]] int height() const { return height_; }
    [[nodiscard]] Motion motion() const { return motion_; }

private:
    void drawBackground(const Picture& picture, std::uint32_t phase, const Rect& area) const;
    void drawZonePlate(const Picture& picture) const;
    void drawBalls(const Picture& picture, std::uint32_t phase) const;
    void drawFooter(const Picture& picture, std::uint32_t number, const WallTime& time) const;

    int width_;
    int height_;
    Motion motion_;
    int unit_;                                          // pixels of one glyph unit
    int stripTop_;                                      // the frame pattern begins here
    Rect footer_;                                       // the line of digits with the small ball
    std::vector<std::vector<std::uint32_t>> rainbows_;  // each holds the period `width_` twice, in its own brightness
    std::vector<std::uint32_t> plate_;                  // the fine rings, plateSize_ squared
    int plateSize_;
    const std::uint8_t* drawnInto_ = nullptr;
    std::uint32_t drawnNumber_ = 0;
    Mark drawnMark_ = Mark::None;
};

}  // namespace lumacast::scene
