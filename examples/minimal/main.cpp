// The shortest application that records itself: a window, three seconds of it, and where the movie is.

#include <xcb/xcb.h>

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <optional>
#include <system_error>
#include <thread>

#include "client/Recorder.h"

// [record]
/// Records a window of this process for a while and copies the movie. The exit status.
int recordWindow(std::uint32_t window, lumacast::Size size, const std::filesystem::path& copy) {
    using namespace lumacast;
    client::Events events;
    events.stopped = [](const std::optional<Error>& error, const std::optional<URL>&) {
        if (error) std::fprintf(stderr, "ended by itself: %s\n", client::textOf(*error).c_str());
    };
    client::Recorder recorder(events);
    const client::StartAnswer start = recorder.startAndWait({.windows = {ContextID{window}}, .size = size});
    if (start.error) {
        std::fprintf(stderr, "not started: %s\n", client::textOf(*start.error).c_str());
        return 1;
    }
    std::this_thread::sleep_for(std::chrono::seconds(3));  // what is to be recorded happens here
    const client::StopAnswer stop = recorder.stopAndWait();
    if (!stop.movie) return 1;
    std::error_code failure;  // the daemon's own file does not stay
    return std::filesystem::copy_file(stop.movie->path(), copy, failure) ? 0 : 1;
}
// [/record]

int main(int argc, char** argv) {
    if (argc != 2) return std::fprintf(stderr, "usage: minimal MOVIE\n"), 2;
    xcb_connection_t* display = xcb_connect(nullptr, nullptr);
    const xcb_screen_t* screen = xcb_setup_roots_iterator(xcb_get_setup(display)).data;
    if (!screen) return std::fprintf(stderr, "no display\n"), 1;
    const xcb_window_t window = xcb_generate_id(display);
    xcb_create_window(display, XCB_COPY_FROM_PARENT, window, screen->root, 0, 0, 320, 240, 0,
                      XCB_WINDOW_CLASS_INPUT_OUTPUT, screen->root_visual, XCB_CW_BACK_PIXEL, &screen->white_pixel);
    xcb_map_window(display, window);
    std::free(xcb_get_input_focus_reply(display, xcb_get_input_focus(display), nullptr));  // the server has done it
    const int status = recordWindow(window, {320, 240}, argv[1]);
    xcb_disconnect(display);
    return status;
}
