// An application that is handed its own frames instead of a movie: it looks at each where the daemon has it, and keeps
// the last one as a picture. A game could recognise its finest moment this way, or send its own stream.

#include <png.h>
#include <xcb/xcb.h>

#include <array>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <span>
#include <string>
#include <thread>
#include <vector>

#include "client/Recorder.h"

namespace {

using namespace lumacast;

constexpr std::uint16_t kWidth = 480, kHeight = 270;

/// A window with three bars, and a square that moves.
class Window {
public:
    Window() : display_(xcb_connect(nullptr, nullptr)) {
        const xcb_screen_t* screen = xcb_setup_roots_iterator(xcb_get_setup(display_)).data;
        if (!screen) return;
        window_ = xcb_generate_id(display_);
        xcb_create_window(display_, XCB_COPY_FROM_PARENT, window_, screen->root, 0, 0, kWidth, kHeight, 0,
                          XCB_WINDOW_CLASS_INPUT_OUTPUT, screen->root_visual, XCB_CW_BACK_PIXEL, &screen->black_pixel);
        xcb_map_window(display_, window_);
        context_ = xcb_generate_id(display_);
        xcb_create_gc(display_, context_, window_, 0, nullptr);
        draw(0);
    }
    Window(const Window&) = delete;
    Window& operator=(const Window&) = delete;
    ~Window() { xcb_disconnect(display_); }

    std::uint32_t number() const { return window_; }
    void draw(int step) {
        constexpr std::array<std::uint32_t, 3> kBars{0xC02020, 0x20C020, 0x2020C0};
        for (std::size_t i = 0; i < kBars.size(); ++i)
            fill(kBars[i], {static_cast<std::int16_t>(i * kWidth / 3), 0, kWidth / 3, kHeight - 30});
        fill(0x000000, {0, kHeight - 30, kWidth, 30});
        fill(0xFFFFFF, {static_cast<std::int16_t>(step * 8 % kWidth), kHeight - 25, 20, 20});
        std::free(xcb_get_input_focus_reply(display_, xcb_get_input_focus(display_), nullptr));  // it is done
    }

private:
    void fill(std::uint32_t colour, xcb_rectangle_t where) {
        xcb_change_gc(display_, context_, XCB_GC_FOREGROUND, &colour);
        xcb_poly_fill_rectangle(display_, window_, context_, 1, &where);
    }

    xcb_connection_t* const display_;
    xcb_window_t window_ = XCB_NONE;
    xcb_gcontext_t context_ = XCB_NONE;
};

// [capture]
/// What came so far. The daemon's library calls from a thread of its own.
class Frames {
public:
    client::Events events() {
        client::Events events;
        events.videoSample = [this](const client::VideoSample& sample) { take(sample); };
        events.audioSample = [this](const client::AudioSample&) {
            const std::lock_guard lock(mutex_);
            ++sounds_;
        };
        return events;
    }

private:
    void take(const client::VideoSample& sample) {
        if (!sample.plane) return;
        // The pixels are the daemon's own memory, blue, green, red and one byte unused: look now, or copy what is to
        // stay.
        const auto pixels = sample.plane->pixels();
        const double now = sample.timing.presentation.seconds();
        const std::lock_guard lock(mutex_);
        if (pictures_++ > 0) longestGap_ = std::max(longestGap_, now - last_);
        last_ = now;
        width_ = sample.plane->width(), height_ = sample.plane->height(), stride_ = sample.plane->stride();
        kept_.assign(pixels.begin(), pixels.end());
    }
    // [/capture]

public:
    /// False when there was no picture, or it can't be written.
    bool save(const char* path) const {
        const std::lock_guard lock(mutex_);
        if (kept_.empty()) return false;
        std::vector<std::uint8_t> rows;  // blue, green, red
        rows.reserve(static_cast<std::size_t>(width_) * static_cast<std::size_t>(height_) * 3);
        for (std::size_t y = 0; y < static_cast<std::size_t>(height_); ++y)
            for (std::size_t x = 0; x < static_cast<std::size_t>(width_); ++x)
                for (std::size_t part = 0; part < 3; ++part) rows.push_back(kept_[y * stride_ + 4 * x + part]);
        png_image image{};
        image.version = PNG_IMAGE_VERSION;
        image.width = static_cast<std::uint32_t>(width_), image.height = static_cast<std::uint32_t>(height_);
        image.format = PNG_FORMAT_BGR;
        return png_image_write_to_file(&image, path, 0, rows.data(), 0, nullptr) != 0;
    }
    std::string summary() const {
        const std::lock_guard lock(mutex_);
        return std::to_string(pictures_) + " pictures of " + std::to_string(width_) + " x " + std::to_string(height_) +
               ", at most " + std::to_string(static_cast<int>(longestGap_ * 1000)) + " ms apart; " +
               std::to_string(sounds_) + " runs of sound";
    }

private:
    mutable std::mutex mutex_;
    int pictures_ = 0, sounds_ = 0;
    double last_ = 0, longestGap_ = 0;
    std::int32_t width_ = 0, height_ = 0;
    std::size_t stride_ = 0;
    std::vector<std::uint8_t> kept_;
};

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) return std::fprintf(stderr, "usage: own_frames PICTURE.png\n"), 2;
    Window window;
    if (window.number() == XCB_NONE) return std::fprintf(stderr, "no display\n"), 1;
    Frames frames;
    client::Recorder recorder(frames.events());
    const auto start =
        recorder.startAndWait({.windows = {ContextID{window.number()}}, .size = {kWidth, kHeight}, .capture = true});
    if (start.error) return std::fprintf(stderr, "not started: %s\n", client::textOf(*start.error).c_str()), 1;
    for (int step = 1; step <= 90; ++step) {
        window.draw(step);
        std::this_thread::sleep_for(std::chrono::milliseconds(33));
    }
    const auto stop = recorder.stopAndWait();
    if (stop.error) return std::fprintf(stderr, "ended: %s\n", client::textOf(*stop.error).c_str()), 1;
    std::printf("%s\n", frames.summary().c_str());
    return frames.save(argv[1]) ? 0 : 1;
}
