#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

namespace lumacast::checkers {

/// A borrowed 8-bit luma plane, rows `stride` bytes apart.
struct LumaView {
    const std::uint8_t* samples = nullptr;
    int width = 0;
    int height = 0;
    std::size_t stride = 0;
};

/// A luma plane of its own, without gaps between rows.
struct LumaPlane {
    int width = 0;
    int height = 0;
    std::vector<std::uint8_t> samples;

    [[nodiscard]] LumaView view() const { return {samples.data(), width, height, static_cast<std::size_t>(width)}; }
};

[[nodiscard]] LumaPlane copyOf(const LumaView& view);

/// The plane turned clockwise by `quarterTurns` times 90 degrees (any sign).
[[nodiscard]] LumaPlane turned(const LumaView& view, int quarterTurns);

/// The frame number drawn by the scene, when the picture was turned clockwise by `quarterTurns` on its way into the
/// movie.
[[nodiscard]] std::optional<std::uint32_t> frameNumberIn(const LumaView& view, int quarterTurns = 0);

/// Whether the picture has the scene's mark; turned as above.
[[nodiscard]] bool isMarked(const LumaView& view, int quarterTurns = 0);

}  // namespace lumacast::checkers
