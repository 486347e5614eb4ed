#include "examples/self_recorder/SceneWindow.h"

#include <unistd.h>

#include <array>
#include <climits>
#include <cstdio>
#include <cstdlib>

namespace lumacast::example {
namespace {

struct Free {
    void operator()(void* memory) const { std::free(memory); }
};
template <typename T>
using Owned = std::unique_ptr<T, Free>;

const xcb_screen_t* screenNumber(xcb_connection_t* connection, int number) {
    auto screens = xcb_setup_roots_iterator(xcb_get_setup(connection));
    for (; screens.rem > 1 && number > 0; --number) xcb_screen_next(&screens);
    return screens.data;
}

// Pictures are drawn as B, G, R, X; another pixel layout would show wrong colours.
bool pixelsAreBgrx(xcb_connection_t* connection, const xcb_screen_t& screen) {
    const xcb_setup_t* setup = xcb_get_setup(connection);
    bool fourBytes = false;
    for (auto format = xcb_setup_pixmap_formats_iterator(setup); format.rem > 0; xcb_format_next(&format))
        fourBytes |= format.data->depth == screen.root_depth && format.data->bits_per_pixel == 32;
    if (!fourBytes || setup->image_byte_order != XCB_IMAGE_ORDER_LSB_FIRST) return false;
    for (auto depth = xcb_screen_allowed_depths_iterator(&screen); depth.rem > 0; xcb_depth_next(&depth))
        for (auto visual = xcb_depth_visuals_iterator(depth.data); visual.rem > 0; xcb_visualtype_next(&visual))
            if (visual.data->visual_id == screen.root_visual)
                return visual.data->red_mask == 0xFF0000 && visual.data->blue_mask == 0xFF;
    return false;
}

}  // namespace

SceneWindow::SceneWindow(int width, int height, const std::string& name) {
    if (!openConnection()) return;
    image_ = std::make_unique<SharedImage>(connection_.get(), width, height);
    error_ = image_->error();
    if (error_.empty()) createWindow(width, height, name);
}

SceneWindow::~SceneWindow() {
    image_.reset();
    if (window_ != 0) xcb_destroy_window(connection_.get(), window_);
    if (connection_) xcb_flush(connection_.get());
}

bool SceneWindow::openConnection() {
    int number = 0;
    connection_.reset(xcb_connect(nullptr, &number));
    if (xcb_connection_has_error(connection_.get()) != 0) {
        error_ = "no display: is DISPLAY set?";
        return false;
    }
    screen_ = screenNumber(connection_.get(), number);
    const Owned<xcb_shm_query_version_reply_t> version(
        xcb_shm_query_version_reply(connection_.get(), xcb_shm_query_version(connection_.get()), nullptr));
    if (!version || version->major_version * 100 + version->minor_version < 102)
        error_ = "the display has no shared memory by descriptor (MIT-SHM 1.2)";
    else if (!pixelsAreBgrx(connection_.get(), *screen_))
        error_ = "the display's pixels aren't 32 bits B, G, R, X";
    else
        completionEvent_ = static_cast<std::uint8_t>(
            xcb_get_extension_data(connection_.get(), &xcb_shm_id)->first_event + XCB_SHM_COMPLETION);
    return error_.empty();
}

void SceneWindow::createWindow(int width, int height, const std::string& name) {
    xcb_connection_t* const connection = connection_.get();
    window_ = xcb_generate_id(connection);
    // No background: the server never shows a blank window between two pictures.
    const std::array<std::uint32_t, 2> values{XCB_BACK_PIXMAP_NONE,
                                              XCB_EVENT_MASK_EXPOSURE | XCB_EVENT_MASK_STRUCTURE_NOTIFY};
    xcb_create_window(connection, XCB_COPY_FROM_PARENT, window_, screen_->root, 0, 0, static_cast<std::uint16_t>(width),
                      static_cast<std::uint16_t>(height), 0, XCB_WINDOW_CLASS_INPUT_OUTPUT, screen_->root_visual,
                      XCB_CW_BACK_PIXMAP | XCB_CW_EVENT_MASK, values.data());
    context_ = xcb_generate_id(connection);
    xcb_create_gc(connection, context_, window_, 0, nullptr);

    setTextProperty("WM_NAME", "STRING", name);
    setTextProperty("_NET_WM_NAME", "UTF8_STRING", name);
    using namespace std::string_literals;
    setTextProperty("WM_CLASS", "STRING", "self_recorder"s + '\0' + name + '\0');
    std::array<char, HOST_NAME_MAX + 1> host{};
    if (::gethostname(host.data(), host.size() - 1) == 0) setTextProperty("WM_CLIENT_MACHINE", "STRING", host.data());
    const auto pid = static_cast<std::uint32_t>(::getpid());
    xcb_change_property(connection, XCB_PROP_MODE_REPLACE, window_, atom("_NET_WM_PID"), XCB_ATOM_CARDINAL, 32, 1,
                        &pid);
    deleteWindow_ = atom("WM_DELETE_WINDOW");
    xcb_change_property(connection, XCB_PROP_MODE_REPLACE, window_, atom("WM_PROTOCOLS"), XCB_ATOM_ATOM, 32, 1,
                        &deleteWindow_);
    xcb_map_window(connection, window_);
    xcb_flush(connection);
}

xcb_atom_t SceneWindow::atom(const char* name) {
    const std::string text(name);
    const auto cookie = xcb_intern_atom(connection_.get(), 0, static_cast<std::uint16_t>(text.size()), text.c_str());
    const Owned<xcb_intern_atom_reply_t> reply(xcb_intern_atom_reply(connection_.get(), cookie, nullptr));
    return reply ? reply->atom : static_cast<xcb_atom_t>(XCB_ATOM_NONE);
}

void SceneWindow::setTextProperty(const char* property, const char* type, const std::string& text) {
    xcb_change_property(connection_.get(), XCB_PROP_MODE_REPLACE, window_, atom(property), atom(type), 8,
                        static_cast<std::uint32_t>(text.size()), text.data());
}

void SceneWindow::put(const std::vector<scene::Rect>& changed) {
    std::vector<xcb_rectangle_t> rectangles;
    for (const scene::Rect& rect : changed)
        rectangles.push_back({static_cast<std::int16_t>(rect.x), static_cast<std::int16_t>(rect.y),
                              static_cast<std::uint16_t>(rect.width), static_cast<std::uint16_t>(rect.height)});
    const auto width = static_cast<std::uint16_t>(picture().width);
    const auto height = static_cast<std::uint16_t>(picture().height);
    // One request for the whole picture, clipped to what changed: a reader never sees half of a frame.
    xcb_set_clip_rectangles(connection_.get(), XCB_CLIP_ORDERING_UNSORTED, context_, 0, 0,
                            static_cast<std::uint32_t>(rectangles.size()), rectangles.data());
    xcb_shm_put_image(connection_.get(), window_, context_, width, height, 0, 0, width, height, 0, 0,
                      screen_->root_depth, XCB_IMAGE_FORMAT_Z_PIXMAP, 1, image_->segment(), 0);
    xcb_flush(connection_.get());
    ++puts_;
}

void SceneWindow::resize(int width, int height) {
    const std::array<std::uint32_t, 2> values{static_cast<std::uint32_t>(width), static_cast<std::uint32_t>(height)};
    xcb_configure_window(connection_.get(), window_, XCB_CONFIG_WINDOW_WIDTH | XCB_CONFIG_WINDOW_HEIGHT, values.data());
    xcb_flush(connection_.get());
}

void SceneWindow::move(int x, int y) {
    const std::array<std::uint32_t, 2> values{static_cast<std::uint32_t>(x), static_cast<std::uint32_t>(y)};
    xcb_configure_window(connection_.get(), window_, XCB_CONFIG_WINDOW_X | XCB_CONFIG_WINDOW_Y, values.data());
    xcb_flush(connection_.get());
}

void SceneWindow::hide() {
    xcb_unmap_window(connection_.get(), window_);
    xcb_flush(connection_.get());
}

void SceneWindow::show() {
    xcb_map_window(connection_.get(), window_);
    xcb_flush(connection_.get());
}

void SceneWindow::raise() {
    const std::uint32_t above = XCB_STACK_MODE_ABOVE;
    xcb_configure_window(connection_.get(), window_, XCB_CONFIG_WINDOW_STACK_MODE, &above);
    xcb_flush(connection_.get());
}

void SceneWindow::pump() {
    while (const Owned<xcb_generic_event_t> event{xcb_poll_for_event(connection_.get())}) handle(*event);
    if (xcb_connection_has_error(connection_.get()) != 0) lost("the display is gone");
}

void SceneWindow::lost(const std::string& why) {
    std::fprintf(stderr, "self_recorder: %s\n", why.c_str());
    if (events.lost) events.lost();
}

void SceneWindow::handle(const xcb_generic_event_t& event) {
    const auto type = static_cast<std::uint8_t>(event.response_type & 0x7F);
    if (type == completionEvent_) {
        --puts_;
        if (puts_ == 0 && events.shown) events.shown();
    } else if (type == 0) {
        const auto& error = reinterpret_cast<const xcb_generic_error_t&>(event);
        lost("X error " + std::to_string(error.error_code) + " in request " + std::to_string(error.major_code));
    } else if (type == XCB_EXPOSE) {
        if (reinterpret_cast<const xcb_expose_event_t&>(event).count == 0 && events.exposed) events.exposed();
    } else if (type == XCB_MAP_NOTIFY) {
        mapped_ = true;
    } else if (type == XCB_UNMAP_NOTIFY) {
        mapped_ = false;
    } else if (type == XCB_CONFIGURE_NOTIFY) {
        const auto& change = reinterpret_cast<const xcb_configure_notify_event_t&>(event);
        configured(change.width, change.height);
    } else if (type == XCB_CLIENT_MESSAGE) {
        if (reinterpret_cast<const xcb_client_message_event_t&>(event).data.data32[0] == deleteWindow_ && events.closed)
            events.closed();
    }
}

void SceneWindow::configured(int width, int height) {
    if (width == picture().width && height == picture().height) return;
    auto image = std::make_unique<SharedImage>(connection_.get(), width, height);
    if (!image->error().empty()) return lost(image->error());
    image_ = std::move(image);
    if (events.resized) events.resized();
}

}  // namespace lumacast::example
