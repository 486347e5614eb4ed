#pragma once
// A window to record: of one colour at a time.

#include <xcb/xcb.h>

#include <cstdint>
#include <cstdlib>
#include <stdexcept>

class Window {
public:
    Window(std::uint16_t width, std::uint16_t height) {
        const xcb_screen_t* screen = xcb_setup_roots_iterator(xcb_get_setup(display_)).data;
        if (!screen) throw std::runtime_error("no display");
        xcb_create_window(display_, XCB_COPY_FROM_PARENT, id_, screen->root, 0, 0, width, height, 0,
                          XCB_WINDOW_CLASS_INPUT_OUTPUT, screen->root_visual, 0, nullptr);
        xcb_map_window(display_, id_);
        fill(0xffffff);
    }
    ~Window() { xcb_disconnect(display_); }
    Window(const Window&) = delete;
    Window& operator=(const Window&) = delete;

    /// 0xRRGGBB. It is on the screen when this returns.
    void fill(std::uint32_t colour) {
        xcb_change_window_attributes(display_, id_, XCB_CW_BACK_PIXEL, &colour);
        xcb_clear_area(display_, 0, id_, 0, 0, 0, 0);
        std::free(xcb_get_input_focus_reply(display_, xcb_get_input_focus(display_), nullptr));
    }
    std::uint32_t id() const { return id_; }

private:
    xcb_connection_t* const display_ = xcb_connect(nullptr, nullptr);
    const xcb_window_t id_ = xcb_generate_id(display_);
};
