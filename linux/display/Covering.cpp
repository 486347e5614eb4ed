#include "linux/display/Covering.h"

#include <optional>
#include <vector>

#include "linux/display/DamageRegion.h"

namespace lumacast::x11 {
namespace {

// Trees are a few levels deep.
constexpr int kDeepest = 64;

/// A window with its border, in its parent's pixels.
PixelRect outside(const xcb_get_geometry_reply_t& geometry) {
    return {geometry.x, geometry.y, geometry.width + 2 * geometry.border_width,
            geometry.height + 2 * geometry.border_width};
}

/// Whether one of these windows, whose places are in the same pixels as `rect`'s, is in front of it.
bool anyCovers(X11Connection& connection, const std::vector<xcb_window_t>& windows, const PixelRect& rect) {
    xcb_connection_t* const x = connection.get();
    std::vector<std::pair<xcb_get_window_attributes_cookie_t, xcb_get_geometry_cookie_t>> questions;
    for (const xcb_window_t window : windows)
        questions.emplace_back(xcb_get_window_attributes(x, window), xcb_get_geometry(x, window));
    bool covers = false;
    for (const auto& [state, place] : questions) {
        const Owned<xcb_get_window_attributes_reply_t> attributes(xcb_get_window_attributes_reply(x, state, nullptr));
        const Owned<xcb_get_geometry_reply_t> geometry(xcb_get_geometry_reply(x, place, nullptr));
        if (!attributes || !geometry || attributes->_class == XCB_WINDOW_CLASS_INPUT_ONLY) continue;
        covers |= attributes->map_state != XCB_MAP_STATE_UNMAPPED && !isEmpty(intersection(outside(*geometry), rect));
    }
    return covers;
}

}  // namespace

bool isWhollyShown(X11Connection& connection, xcb_window_t window) {
    xcb_connection_t* const x = connection.get();
    const Owned<xcb_get_window_attributes_reply_t> attributes(
        xcb_get_window_attributes_reply(x, xcb_get_window_attributes(x, window), nullptr));
    if (!attributes || attributes->map_state != XCB_MAP_STATE_VIEWABLE) return false;
    std::optional<PixelRect> inside;  // the window itself, in the pixels of what `window` is in
    for (int level = 0; level < kDeepest; ++level) {
        const auto treeCookie = xcb_query_tree(x, window);
        const auto placeCookie = xcb_get_geometry(x, window);
        const Owned<xcb_query_tree_reply_t> tree(xcb_query_tree_reply(x, treeCookie, nullptr));
        const Owned<xcb_get_geometry_reply_t> place(xcb_get_geometry_reply(x, placeCookie, nullptr));
        if (!tree || !place) return false;
        const PixelRect own{0, 0, place->width, place->height};
        if (inside && !contains(own, *inside)) return false;
        if (tree->parent == XCB_NONE) return inside.has_value();
        const PixelRect& rect = inside ? *inside : own;
        inside = PixelRect{rect.x + place->x + place->border_width, rect.y + place->y + place->border_width, rect.width,
                           rect.height};
        const Owned<xcb_query_tree_reply_t> around(
            xcb_query_tree_reply(x, xcb_query_tree(x, tree->parent), nullptr));
        if (!around) return false;
        const xcb_window_t* const children = xcb_query_tree_children(around.get());
        std::vector<xcb_window_t> above;
        for (int i = xcb_query_tree_children_length(around.get()) - 1; i >= 0 && children[i] != window; --i)
            above.push_back(children[i]);
        if (anyCovers(connection, above, *inside)) return false;
        window = tree->parent;
    }
    return false;
}

}  // namespace lumacast::x11
