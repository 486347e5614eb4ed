#pragma once
// Windows of a test's own X client.

#include <xcb/xcb.h>

#include <array>
#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "base/Identifiers.h"
#include "linux/display/Wake.h"
#include "linux/display/X11Connection.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast::test {

/// One window on a connection of its own. It is painted when told to, and by a thread of its own whenever the server
/// asks for that (Expose). Colours are 0xRRGGBB. Every operation returns when the server has done it.
class TestWindow final {
public:
    struct Look {
        PixelRect place{0, 0, 320, 240};
        static constexpr std::int64_t kNone = -1;
        std::uint32_t colour = 0;
        std::uint16_t border = 0;
        std::int64_t background = kNone;  ///< a colour that the server paints
        bool mapped = true;
        bool repaints = true;             ///< on Expose
        bool isSlow = false;              ///< repaints only when a client asks for it: the server's asking it has not heard yet
        xcb_window_t parent = XCB_NONE;   ///< the screen's root when none
        std::uint8_t depth = 0;           ///< the parent's when 0
    };

    TestWindow(const std::string& display, Look look);
    ~TestWindow();
    TestWindow(const TestWindow&) = delete;
    TestWindow& operator=(const TestWindow&) = delete;

    xcb_connection_t* connection() const { return connection_.get(); }
    xcb_window_t id() const { return window_; }
    ContextID context() const { return ContextID{window_}; }
    const xcb_screen_t& screen() const { return *screen_; }

    /// Fills the whole window; that is also what later repaints show.
    void paint(std::uint32_t colour);
    void paintPart(const PixelRect& rect, std::uint32_t colour);
    void move(int x, int y);
    void resize(int width, int height);
    void raise();
    void map();
    void unmap();
    void destroy();
    void sync() const;

    std::uint64_t repaints() const { return repaints_.load(); }

private:
    struct Disconnect {
        void operator()(xcb_connection_t* connection) const { xcb_disconnect(connection); }
    };
    void fill(const PixelRect& rect, std::uint32_t colour);
    void serveEvents();
    void configure(std::uint16_t mask, std::array<std::uint32_t, 4> values);

    std::unique_ptr<xcb_connection_t, Disconnect> connection_;
    const xcb_screen_t* screen_ = nullptr;
    xcb_window_t window_ = XCB_NONE;
    xcb_gcontext_t context_ = XCB_NONE;
    const Look look_;
    std::mutex mutex_;  // guards colour and size
    std::uint32_t colour_ = 0;
    int width_ = 0, height_ = 0;
    std::atomic<std::uint64_t> repaints_{0};
    std::atomic<bool> over_{false};
    x11::Wake wake_;
    std::thread events_;
};

}  // namespace lumacast::test
