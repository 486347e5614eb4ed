#pragma once

#include <cstddef>
#include <cstdint>

namespace lumacast::scene {

/// A borrowed 32-bit picture: bytes B, G, R, X in memory order, rows `stride` bytes apart (stride >= 4 * width,
/// divisible by 4, pixels aligned to 4 bytes). The owner keeps the memory alive.
struct Picture {
    std::uint8_t* pixels = nullptr;
    int width = 0;
    int height = 0;
    std::size_t stride = 0;

    [[nodiscard]] std::uint32_t* row(int y) const {
        return reinterpret_cast<std::uint32_t*>(pixels + static_cast<std::size_t>(y) * stride);
    }
};

/// A rectangle in pixels, origin at the top left.
struct Rect {
    int x = 0;
    int y = 0;
    int width = 0;
    int height = 0;

    friend bool operator==(const Rect&, const Rect&) = default;
};

/// The smallest picture the scene can be drawn into.
inline constexpr int kMinimumWidth = 160;
inline constexpr int kMinimumHeight = 90;

}  // namespace lumacast::scene
