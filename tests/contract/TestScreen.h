#pragma once
// The screen of a test's own display: its pointer, its size, its screen saver, and what is on it.

#include <xcb/xcb.h>

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "writer/media/SampleBuffer.h"

namespace lumacast::test {

/// Pixels as 0xRRGGBB, row by row.
struct Pixels {
    std::int32_t width = 0, height = 0;
    std::vector<std::uint32_t> colours;

    std::uint32_t at(std::int32_t x, std::int32_t y) const {
        return colours[static_cast<std::size_t>(y) * static_cast<std::size_t>(width) + static_cast<std::size_t>(x)];
    }
    bool operator==(const Pixels&) const = default;
};

/// A plane's picture as it is to be seen: turned clockwise where the transform flags say so.
Pixels uprightPixels(const SharedPlane& plane, std::uint32_t transformFlags);

/// On a connection of its own. Every operation returns when the server has done it.
class TestScreen final {
public:
    /// What the pointer looks like: premultiplied 0xAARRGGBB.
    struct PointerLook {
        std::uint16_t width = 0, height = 0, hotX = 0, hotY = 0;
        std::vector<std::uint32_t> pixels;
    };
    static PointerLook square(std::uint16_t side, std::uint32_t pixel) {
        return {side, side, 0, 0, std::vector<std::uint32_t>(static_cast<std::size_t>(side) * side, pixel)};
    }

    explicit TestScreen(const std::string& display);
    ~TestScreen();
    TestScreen(const TestScreen&) = delete;
    TestScreen& operator=(const TestScreen&) = delete;

    void movePointer(int x, int y);
    /// On the screen itself, and over windows that want none of their own.
    void setPointer(const PointerLook& look);
    /// Another size, at most the one that the screen began with.
    void resize(int width, int height);
    void saveScreen(bool on);
    /// As the server lets others read it: without the pointer.
    Pixels withoutPointer() const;
    /// As the user sees it, if the pointer has this look and lies there.
    Pixels withPointer(const PointerLook& look, int x, int y) const;

private:
    void sync() const;
    struct Disconnect {
        void operator()(xcb_connection_t* connection) const { xcb_disconnect(connection); }
    };
    std::unique_ptr<xcb_connection_t, Disconnect> connection_;
    const xcb_screen_t* screen_ = nullptr;
    std::uint32_t argb_ = 0;  ///< the format of pictures with alpha
};

}  // namespace lumacast::test
