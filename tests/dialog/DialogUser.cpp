#include "tests/dialog/DialogUser.h"

#include <signal.h>

#include <xcb/res.h>
#include <xcb/xtest.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string_view>
#include <thread>

namespace lumacast::test {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr std::string_view kClass = "lumacast-alert";
constexpr int kDeepest = 4;
/// The daemon believes no press before it has seen the dialog itself.
constexpr milliseconds kGlance{250};

struct Free {
    void operator()(void* memory) const { std::free(memory); }
};
template <class T>
using Owned = std::unique_ptr<T, Free>;

struct Run {
    int from = 0, to = 0;
};

/// The stretches of a row that differ from the background, if they are as long as a button is.
std::vector<Run> longRuns(const std::uint32_t* row, int width, std::uint32_t background) {
    constexpr int kShortest = 50;
    std::vector<Run> runs;
    for (int x = 0; x < width;) {
        if (row[x] == background) {
            ++x;
            continue;
        }
        const int from = x;
        while (x < width && row[x] != background) ++x;
        if (x - from >= kShortest) runs.push_back({from, x});
    }
    return runs;
}

}  // namespace

DialogUser::DialogUser(const std::string& display) : connection_(xcb_connect(display.c_str(), nullptr)) {
    if (works()) root_ = xcb_setup_roots_iterator(xcb_get_setup(connection_.get())).data->root;
}

void DialogUser::sync() {
    const Owned<xcb_get_input_focus_reply_t> done(
        xcb_get_input_focus_reply(connection_.get(), xcb_get_input_focus(connection_.get()), nullptr));
}

xcb_atom_t DialogUser::atom(const char* name) {
    const auto cookie = xcb_intern_atom(connection_.get(), 0, static_cast<std::uint16_t>(std::strlen(name)), name);
    const Owned<xcb_intern_atom_reply_t> reply(xcb_intern_atom_reply(connection_.get(), cookie, nullptr));
    return reply ? reply->atom : static_cast<xcb_atom_t>(XCB_ATOM_NONE);
}

bool DialogUser::isDialog(xcb_window_t window) {
    xcb_connection_t* const x = connection_.get();
    const Owned<xcb_get_property_reply_t> names(
        xcb_get_property_reply(x, xcb_get_property(x, 0, window, XCB_ATOM_WM_CLASS, XCB_ATOM_STRING, 0, 64), nullptr));
    if (!names) return false;
    // The instance's name, a zero, the class, a zero.
    const std::string_view text(static_cast<const char*>(xcb_get_property_value(names.get())),
                                static_cast<std::size_t>(xcb_get_property_value_length(names.get())));
    const std::size_t zero = text.find('\0');
    if (zero == std::string_view::npos || std::string_view(text.substr(zero + 1).data()) != kClass) return false;
    const Owned<xcb_get_window_attributes_reply_t> attributes(
        xcb_get_window_attributes_reply(x, xcb_get_window_attributes(x, window), nullptr));
    return attributes && attributes->map_state == XCB_MAP_STATE_VIEWABLE;
}

pid_t DialogUser::ownerOf(xcb_window_t window) {
    xcb_connection_t* const x = connection_.get();
    const xcb_res_client_id_spec_t asked{window, XCB_RES_CLIENT_ID_MASK_LOCAL_CLIENT_PID};
    const Owned<xcb_res_query_client_ids_reply_t> reply(
        xcb_res_query_client_ids_reply(x, xcb_res_query_client_ids(x, 1, &asked), nullptr));
    if (!reply) return -1;
    const auto id = xcb_res_query_client_ids_ids_iterator(reply.get());
    if (id.rem == 0 || xcb_res_client_id_value_value_length(id.data) != 1) return -1;
    return static_cast<pid_t>(*xcb_res_client_id_value_value(id.data));
}

std::vector<DialogUser::Dialog> DialogUser::dialogs() {
    xcb_connection_t* const x = connection_.get();
    std::vector<Dialog> found;
    std::vector<xcb_window_t> level{root_};
    for (int depth = 0; depth < kDeepest && works(); ++depth) {
        std::vector<xcb_window_t> children;
        for (const xcb_window_t parent : level) {
            const Owned<xcb_query_tree_reply_t> tree(xcb_query_tree_reply(x, xcb_query_tree(x, parent), nullptr));
            if (!tree) continue;
            const xcb_window_t* const first = xcb_query_tree_children(tree.get());
            children.insert(children.end(), first, first + xcb_query_tree_children_length(tree.get()));
        }
        for (const xcb_window_t window : children) {
            if (!isDialog(window)) continue;
            const Owned<xcb_get_geometry_reply_t> size(xcb_get_geometry_reply(x, xcb_get_geometry(x, window), nullptr));
            const Owned<xcb_translate_coordinates_reply_t> place(
                xcb_translate_coordinates_reply(x, xcb_translate_coordinates(x, window, root_, 0, 0), nullptr));
            if (size && place)
                found.push_back({window, ownerOf(window), place->dst_x, place->dst_y, size->width, size->height});
        }
        level = std::move(children);
    }
    return found;
}

std::optional<DialogUser::Dialog> DialogUser::waitForDialog(std::optional<pid_t> pid, std::chrono::seconds limit) {
    const auto deadline = steady_clock::now() + limit;
    xcb_window_t looksAt = XCB_NONE;
    auto since = steady_clock::now();
    while (works()) {
        bool any = false;
        for (const Dialog& dialog : dialogs()) {
            if ((pid && *pid != dialog.pid) || buttons(dialog).empty()) continue;
            any = true;
            if (dialog.window != looksAt) since = steady_clock::now();
            looksAt = dialog.window;
            if (steady_clock::now() - since >= kGlance) return dialog;
            break;
        }
        if (!any) looksAt = XCB_NONE;
        if (steady_clock::now() > deadline) break;
        std::this_thread::sleep_for(milliseconds(10));
    }
    return std::nullopt;
}

// The buttons are the lowest thing in a dialog, with the background between them.
std::vector<DialogUser::Place> DialogUser::buttons(const Dialog& dialog) {
    xcb_connection_t* const x = connection_.get();
    const int top = dialog.height / 3;
    const auto height = static_cast<std::uint16_t>(dialog.height - top);
    const Owned<xcb_get_image_reply_t> image(xcb_get_image_reply(
        x,
        xcb_get_image(x, XCB_IMAGE_FORMAT_Z_PIXMAP, dialog.window, 0, static_cast<std::int16_t>(top),
                      static_cast<std::uint16_t>(dialog.width), height, ~0U),
        nullptr));
    const auto width = static_cast<std::size_t>(dialog.width);
    if (!image || static_cast<std::size_t>(xcb_get_image_data_length(image.get())) < width * height * 4) return {};
    std::vector<std::uint32_t> pixels(width * height);
    std::memcpy(pixels.data(), xcb_get_image_data(image.get()), pixels.size() * 4);
    for (std::uint32_t& pixel : pixels) pixel &= 0xFFFFFF;
    const std::uint32_t background = pixels[width * (height - 2U) + 2];
    for (int y = height - 1; y > 20; --y) {
        const auto runs = longRuns(pixels.data() + width * static_cast<std::size_t>(y), dialog.width, background);
        if (runs.size() < 2 || runs.size() > 3) continue;
        std::vector<Place> places;
        for (const Run& run : runs) places.push_back({(run.from + run.to) / 2, top + y - 14});
        return places;
    }
    return {};
}

void DialogUser::fake(std::uint8_t type, std::uint8_t detail, int x, int y) {
    xcb_test_fake_input(connection_.get(), type, detail, XCB_CURRENT_TIME, root_, static_cast<std::int16_t>(x),
                        static_cast<std::int16_t>(y), 0);
    sync();
}

bool DialogUser::click(const Dialog& dialog, Button button) {
    const std::vector<Place> places = buttons(dialog);
    if (places.empty() || (button == Button::Alternate && places.size() != 3)) return false;
    const Place place = button == Button::Other     ? places.front()
                        : button == Button::Default ? places.back()
                                                    : places[1];
    const std::uint32_t above = XCB_STACK_MODE_ABOVE;
    xcb_configure_window(connection_.get(), dialog.window, XCB_CONFIG_WINDOW_STACK_MODE, &above);
    fake(XCB_MOTION_NOTIFY, 0, dialog.x + place.x, dialog.y + place.y);
    fake(XCB_BUTTON_PRESS, 1);
    fake(XCB_BUTTON_RELEASE, 1);
    return works();
}

void DialogUser::press(const Dialog& dialog, xcb_keysym_t key) {
    xcb_connection_t* const x = connection_.get();
    xcb_set_input_focus(x, XCB_INPUT_FOCUS_POINTER_ROOT, dialog.window, XCB_CURRENT_TIME);
    const xcb_setup_t* const setup = xcb_get_setup(x);
    const std::uint8_t first = setup->min_keycode, count = static_cast<std::uint8_t>(setup->max_keycode - first + 1);
    const Owned<xcb_get_keyboard_mapping_reply_t> mapping(
        xcb_get_keyboard_mapping_reply(x, xcb_get_keyboard_mapping(x, first, count), nullptr));
    if (!mapping) return;
    const xcb_keysym_t* const symbols = xcb_get_keyboard_mapping_keysyms(mapping.get());
    for (int code = 0; code < count; ++code) {
        if (symbols[code * mapping->keysyms_per_keycode] != key) continue;
        fake(XCB_KEY_PRESS, static_cast<std::uint8_t>(first + code));
        fake(XCB_KEY_RELEASE, static_cast<std::uint8_t>(first + code));
        return;
    }
}

void DialogUser::close(const Dialog& dialog) {
    xcb_client_message_event_t event{};
    event.response_type = XCB_CLIENT_MESSAGE;
    event.format = 32;
    event.window = dialog.window;
    event.type = atom("WM_PROTOCOLS");
    event.data.data32[0] = atom("WM_DELETE_WINDOW");
    xcb_send_event(connection_.get(), 0, dialog.window, 0, reinterpret_cast<const char*>(&event));
    sync();
}

void DialogUser::destroy(const Dialog& dialog) {
    xcb_destroy_window(connection_.get(), dialog.window);
    sync();
}

void DialogUser::killClient(const Dialog& dialog) {
    xcb_kill_client(connection_.get(), dialog.window);
    sync();
}

bool DialogUser::gone(xcb_window_t window) {
    const Owned<xcb_get_geometry_reply_t> size(
        xcb_get_geometry_reply(connection_.get(), xcb_get_geometry(connection_.get(), window), nullptr));
    return size == nullptr;
}

bool DialogUser::killProgram(const Dialog& dialog) {
    // -1 would be everybody.
    return dialog.pid > 1 && ::kill(dialog.pid, SIGKILL) == 0;
}

bool DialogUser::answer(Button button, std::optional<pid_t> pid, std::chrono::seconds limit, milliseconds look) {
    const auto deadline = steady_clock::now() + limit;
    const auto dialog = waitForDialog(pid, limit);
    if (!dialog) return false;
    std::this_thread::sleep_for(look);
    if (!click(*dialog, button)) return false;
    while (!gone(dialog->window)) {
        if (!works() || steady_clock::now() > deadline) return false;
        std::this_thread::sleep_for(milliseconds(10));
    }
    return works();
}

}  // namespace lumacast::test
