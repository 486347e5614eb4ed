#pragma once
// Draws what the synthetic display shows.

#include <cstdint>
#include <optional>
#include <vector>

#include "base/Identifiers.h"
#include "examples/scene/Scene.h"
#include "headless/display/PlaneMemory.h"
#include "linux/display/Turn.h"

namespace lumacast::headless {

/// Each shown thing has a colour of its own, 0xRRGGBB: a square in the picture says what is shown.
std::uint32_t colourOf(ContextID window);
inline constexpr std::uint32_t kScreenColour = 0xF0F0F0;

/// The scene of the examples, with the picture's number in it and the mark on it, and one square for each thing that is
/// shown, side by side from the left. The screen is wider than high, so its frames, which are always portrait, have it
/// lying in them turned by a quarter counterclockwise. What is too small for the scene is of the first thing's colour
/// all over. Serves one lane.
class Painter final {
public:
    /// Of frames of this size, in memory.
    Painter(std::int32_t width, std::int32_t height, x11::Turn turn);

    void paint(PlaneMemory& memory, std::int64_t number, const std::vector<std::uint32_t>& colours);

private:
    void paintUpright(const scene::Picture& picture, std::int64_t number, const std::vector<std::uint32_t>& colours);

    const std::int32_t width_, height_;  ///< upright
    const x11::Turn turn_;
    std::optional<scene::Scene> scene_;
    std::vector<std::uint32_t> upright_;  ///< where the picture is drawn before it is turned
};

}  // namespace lumacast::headless
