#include "linux/display/ActiveWindow.h"

#include <span>

namespace lumacast::x11 {
namespace {

constexpr std::uint32_t kMostWindows = 4096;

}  // namespace

ActiveWindow::ActiveWindow(X11Connection& connection)
    : connection_(connection),
      activeWindow_(connection.atom("_NET_ACTIVE_WINDOW")),
      clientList_(connection.atom("_NET_CLIENT_LIST")),
      managerCheck_(connection.atom("_NET_SUPPORTING_WM_CHECK")) {}

std::vector<xcb_window_t> ActiveWindow::windowsIn(xcb_atom_t property, std::uint32_t most) {
    xcb_connection_t* const x = connection_.get();
    const auto cookie = xcb_get_property(x, 0, connection_.screen().root, property, XCB_ATOM_WINDOW, 0, most);
    const Owned<xcb_get_property_reply_t> reply(xcb_get_property_reply(x, cookie, nullptr));
    if (!reply || reply->format != 32) return {};
    const auto* const windows = static_cast<const xcb_window_t*>(xcb_get_property_value(reply.get()));
    return {windows, windows + reply->value_len};
}

xcb_window_t ActiveWindow::windowIn(xcb_window_t of, xcb_atom_t property) {
    xcb_connection_t* const x = connection_.get();
    const auto cookie = xcb_get_property(x, 0, of, property, XCB_ATOM_WINDOW, 0, 1);
    const Owned<xcb_get_property_reply_t> reply(xcb_get_property_reply(x, cookie, nullptr));
    if (!reply || reply->format != 32 || reply->value_len != 1) return XCB_NONE;
    return *static_cast<const xcb_window_t*>(xcb_get_property_value(reply.get()));
}

// The property may be left over from a window manager that died; its window has died with it.
bool ActiveWindow::hasWindowManager() {
    const xcb_window_t manager = windowIn(connection_.screen().root, managerCheck_);
    return manager != XCB_NONE && windowIn(manager, managerCheck_) == manager;
}

xcb_window_t ActiveWindow::current() {
    if (hasWindowManager()) return windowIn(connection_.screen().root, activeWindow_);
    const auto windows = shownWindows();
    return windows.empty() ? static_cast<xcb_window_t>(XCB_NONE) : windows.back();
}

std::vector<xcb_window_t> ActiveWindow::applicationWindows() {
    return hasWindowManager() ? windowsIn(clientList_, kMostWindows) : shownWindows();
}

// From the lowest to the topmost. Menus and hints, which no window manager would manage, don't count where there are
// others.
std::vector<xcb_window_t> ActiveWindow::shownWindows() {
    xcb_connection_t* const x = connection_.get();
    const Owned<xcb_query_tree_reply_t> tree(
        xcb_query_tree_reply(x, xcb_query_tree(x, connection_.screen().root), nullptr));
    if (!tree) return {};
    const std::span<const xcb_window_t> children(xcb_query_tree_children(tree.get()),
                                                 static_cast<std::size_t>(xcb_query_tree_children_length(tree.get())));
    std::vector<xcb_get_window_attributes_cookie_t> cookies;
    for (const xcb_window_t child : children) cookies.push_back(xcb_get_window_attributes(x, child));
    std::vector<xcb_window_t> ordinary, others;
    for (std::size_t i = 0; i < children.size(); ++i) {
        const Owned<xcb_get_window_attributes_reply_t> attributes(
            xcb_get_window_attributes_reply(x, cookies[i], nullptr));
        if (!attributes || attributes->map_state != XCB_MAP_STATE_VIEWABLE) continue;
        if (attributes->_class == XCB_WINDOW_CLASS_INPUT_ONLY) continue;
        (attributes->override_redirect != 0 ? others : ordinary).push_back(children[i]);
    }
    return ordinary.empty() ? others : ordinary;
}

void ActiveWindow::watch(bool wanted) {
    const std::uint32_t events =
        wanted ? XCB_EVENT_MASK_PROPERTY_CHANGE | XCB_EVENT_MASK_SUBSTRUCTURE_NOTIFY : XCB_EVENT_MASK_NO_EVENT;
    xcb_change_window_attributes(connection_.get(), connection_.screen().root, XCB_CW_EVENT_MASK, &events);
    xcb_flush(connection_.get());
}

ActiveWindow::Change ActiveWindow::meaningOf(const xcb_generic_event_t& event) const {
    switch (event.response_type & 0x7F) {
        case XCB_PROPERTY_NOTIFY: {
            const xcb_atom_t atom = reinterpret_cast<const xcb_property_notify_event_t&>(event).atom;
            // With the window manager the windows that count come or go.
            if (atom == clientList_ || atom == managerCheck_) return Change::Windows;
            return atom == activeWindow_ ? Change::Active : Change::None;
        }
        case XCB_MAP_NOTIFY:
        case XCB_REPARENT_NOTIFY:
            return Change::Windows;
        case XCB_UNMAP_NOTIFY:
        case XCB_DESTROY_NOTIFY:
        case XCB_CONFIGURE_NOTIFY:  // also another order
        case XCB_CIRCULATE_NOTIFY:
            return Change::Active;
        default:
            return Change::None;
    }
}

}  // namespace lumacast::x11
