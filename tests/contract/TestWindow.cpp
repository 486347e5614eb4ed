#include "tests/contract/TestWindow.h"

#include <poll.h>

#include <vector>

namespace lumacast::test {

using x11::Owned;

namespace {

xcb_visualid_t visualOf(const xcb_screen_t& screen, std::uint8_t depth) {
    for (auto depths = xcb_screen_allowed_depths_iterator(&screen); depths.rem > 0; xcb_depth_next(&depths))
        if (depths.data->depth == depth && xcb_depth_visuals_length(depths.data) > 0)
            return xcb_depth_visuals(depths.data)->visual_id;
    return XCB_NONE;
}

}  // namespace

TestWindow::TestWindow(const std::string& display, Look look)
    : connection_(xcb_connect(display.c_str(), nullptr)),
      screen_(xcb_setup_roots_iterator(xcb_get_setup(connection_.get())).data),
      look_(look),
      colour_(look.colour),
      width_(look.place.width),
      height_(look.place.height) {
    xcb_connection_t* const x = connection_.get();
    window_ = xcb_generate_id(x);
    const xcb_window_t parent = look.parent != XCB_NONE ? look.parent : screen_->root;
    // In the order of the mask's bits.
    std::uint32_t mask = 0;
    std::vector<std::uint32_t> values;
    const auto set = [&](std::uint32_t bit, std::uint32_t value) { mask |= bit, values.push_back(value); };
    if (look.background != Look::kNone) set(XCB_CW_BACK_PIXEL, static_cast<std::uint32_t>(look.background));
    xcb_visualid_t visual = XCB_COPY_FROM_PARENT;
    if (look.depth != 0) {
        // Another depth than the parent's takes a border and colours of its own.
        visual = visualOf(*screen_, look.depth);
        const xcb_colormap_t colours = xcb_generate_id(x);
        xcb_create_colormap(x, XCB_COLORMAP_ALLOC_NONE, colours, screen_->root, visual);
        set(XCB_CW_BORDER_PIXEL, 0);
        set(XCB_CW_EVENT_MASK, XCB_EVENT_MASK_EXPOSURE | XCB_EVENT_MASK_STRUCTURE_NOTIFY);
        set(XCB_CW_COLORMAP, colours);
    } else {
        set(XCB_CW_EVENT_MASK, XCB_EVENT_MASK_EXPOSURE | XCB_EVENT_MASK_STRUCTURE_NOTIFY);
    }
    xcb_create_window(x, look.depth, window_, parent, static_cast<std::int16_t>(look.place.x),
                      static_cast<std::int16_t>(look.place.y), static_cast<std::uint16_t>(width_),
                      static_cast<std::uint16_t>(height_), look.border, XCB_WINDOW_CLASS_INPUT_OUTPUT,
                      visual, mask, values.data());
    context_ = xcb_generate_id(x);
    xcb_create_gc(x, context_, window_, 0, nullptr);
    events_ = std::thread([this] { serveEvents(); });
    if (look.mapped) map();
    if (look.mapped) paint(look.colour);
}

TestWindow::~TestWindow() {
    over_ = true;
    wake_.signal();
    events_.join();
}

void TestWindow::serveEvents() {
    xcb_connection_t* const x = connection_.get();
    while (!over_) {
        bool exposed = false;
        while (const Owned<xcb_generic_event_t> event{xcb_poll_for_event(x)})
            exposed |= (event->response_type & 0x7F) == XCB_EXPOSE && (!look_.isSlow || (event->response_type & 0x80) != 0);
        if (exposed && look_.repaints) {
            const std::lock_guard lock(mutex_);
            ++repaints_;
            fill({0, 0, width_, height_}, colour_);
            xcb_flush(x);
            continue;
        }
        // Replies that another thread waits for may bring events without waking this one for long.
        std::array<pollfd, 2> polled{{{wake_.descriptor(), POLLIN, 0}, {xcb_get_file_descriptor(x), POLLIN, 0}}};
        ::poll(polled.data(), polled.size(), 5);
        if ((polled[1].revents & (POLLHUP | POLLERR)) != 0) break;
    }
}

void TestWindow::sync() const {
    const Owned<xcb_get_input_focus_reply_t> done(
        xcb_get_input_focus_reply(connection_.get(), xcb_get_input_focus(connection_.get()), nullptr));
}

void TestWindow::fill(const PixelRect& rect, std::uint32_t colour) {
    xcb_change_gc(connection_.get(), context_, XCB_GC_FOREGROUND, &colour);
    const xcb_rectangle_t area{static_cast<std::int16_t>(rect.x), static_cast<std::int16_t>(rect.y),
                               static_cast<std::uint16_t>(rect.width), static_cast<std::uint16_t>(rect.height)};
    xcb_poly_fill_rectangle(connection_.get(), window_, context_, 1, &area);
}

void TestWindow::paint(std::uint32_t colour) {
    {
        const std::lock_guard lock(mutex_);
        colour_ = colour;
        fill({0, 0, width_, height_}, colour);
    }
    sync();
}

void TestWindow::paintPart(const PixelRect& rect, std::uint32_t colour) {
    {
        const std::lock_guard lock(mutex_);
        fill(rect, colour);
    }
    sync();
}

void TestWindow::configure(std::uint16_t mask, std::array<std::uint32_t, 4> values) {
    xcb_configure_window(connection_.get(), window_, mask, values.data());
    sync();
}

void TestWindow::move(int x, int y) {
    configure(XCB_CONFIG_WINDOW_X | XCB_CONFIG_WINDOW_Y,
              {static_cast<std::uint32_t>(x), static_cast<std::uint32_t>(y)});
}

void TestWindow::resize(int width, int height) {
    {
        const std::lock_guard lock(mutex_);
        width_ = width;
        height_ = height;
    }
    configure(XCB_CONFIG_WINDOW_WIDTH | XCB_CONFIG_WINDOW_HEIGHT,
              {static_cast<std::uint32_t>(width), static_cast<std::uint32_t>(height)});
}

void TestWindow::raise() { configure(XCB_CONFIG_WINDOW_STACK_MODE, {XCB_STACK_MODE_ABOVE}); }

void TestWindow::map() {
    xcb_map_window(connection_.get(), window_);
    sync();
}

void TestWindow::unmap() {
    xcb_unmap_window(connection_.get(), window_);
    sync();
}

void TestWindow::destroy() {
    xcb_destroy_window(connection_.get(), window_);
    sync();
}

}  // namespace lumacast::test
