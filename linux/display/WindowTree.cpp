#include "linux/display/WindowTree.h"

#include <algorithm>
#include <map>
#include <optional>
#include <utility>

namespace lumacast::x11 {
namespace {

// Trees are a few levels deep; one that is being rebuilt while it is read could seem to have a circle.
constexpr std::size_t kDeepest = 64;
// Ancestors that are new are watched, and the tree is read again: they may have moved before.
constexpr int kLooks = 4;

}  // namespace

/// The windows from the wanted ones up to the root, as the server told them.
class WindowTree::Nodes final {
public:
    Nodes(X11Connection& connection, const std::vector<xcb_window_t>& windows) : connection_(connection) {
        std::vector<xcb_window_t> level = windows;
        for (std::size_t depth = 0; depth < kDeepest && !level.empty(); ++depth) level = readLevel(level);
    }

    bool exists(xcb_window_t window) const { return nodes_.contains(window); }
    const std::map<xcb_window_t, Node>& all() const { return nodes_; }

    /// From the root down: which child of its parent each one is. Ordered, paths are in stacking order: a window is
    /// below its children.
    std::vector<std::size_t> pathTo(xcb_window_t window) const {
        std::vector<std::size_t> path;
        auto node = nodes_.find(window);
        while (node != nodes_.end() && path.size() < kDeepest) {
            const auto parent = nodes_.find(node->second.parent);
            if (parent == nodes_.end()) break;
            const auto& children = parent->second.children;
            path.push_back(
                static_cast<std::size_t>(std::find(children.begin(), children.end(), node->first) - children.begin()));
            node = parent;
        }
        std::reverse(path.begin(), path.end());
        return path;
    }

private:
    // Gives the parents that aren't known yet. All questions go out before the first answer is waited for.
    std::vector<xcb_window_t> readLevel(const std::vector<xcb_window_t>& level) {
        xcb_connection_t* const x = connection_.get();
        std::vector<xcb_query_tree_cookie_t> cookies;
        for (const xcb_window_t window : level) cookies.push_back(xcb_query_tree(x, window));
        std::vector<xcb_window_t> parents;
        for (std::size_t i = 0; i < level.size(); ++i) {
            const Owned<xcb_query_tree_reply_t> reply(xcb_query_tree_reply(x, cookies[i], nullptr));
            if (!reply) continue;
            const xcb_window_t* const children = xcb_query_tree_children(reply.get());
            nodes_[level[i]] = {reply->parent, {children, children + xcb_query_tree_children_length(reply.get())}};
            if (reply->parent != XCB_NONE) parents.push_back(reply->parent);
        }
        std::sort(parents.begin(), parents.end());
        parents.erase(std::unique(parents.begin(), parents.end()), parents.end());
        std::erase_if(parents, [this](xcb_window_t parent) { return nodes_.contains(parent); });
        return parents;
    }

    X11Connection& connection_;
    std::map<xcb_window_t, Node> nodes_;
};

WindowTree::~WindowTree() {
    for (const xcb_window_t ancestor : ancestors_)
        if (!isFollowed(ancestor)) select(ancestor, XCB_EVENT_MASK_NO_EVENT);
}

bool WindowTree::isFollowed(xcb_window_t window) const {
    return std::find(windows_.begin(), windows_.end(), window) != windows_.end();
}

void WindowTree::select(xcb_window_t window, std::uint32_t events) const {
    xcb_change_window_attributes(connection_.get(), window, XCB_CW_EVENT_MASK, &events);
}

// True when there are new ones.
bool WindowTree::watchAncestors(const Nodes& nodes) {
    std::set<xcb_window_t> ancestors;
    bool more = false;
    for (const auto& [window, node] : nodes.all()) {
        if (isFollowed(window)) continue;
        ancestors.insert(window);
        if (ancestors_.contains(window)) continue;
        select(window, XCB_EVENT_MASK_STRUCTURE_NOTIFY);
        more = true;
    }
    for (const xcb_window_t former : ancestors_)
        if (!ancestors.contains(former) && !isFollowed(former)) select(former, XCB_EVENT_MASK_NO_EVENT);
    ancestors_ = std::move(ancestors);
    return more;
}

WindowTree::Look WindowTree::look() {
    std::optional<Nodes> nodes;
    for (int i = 0; i < kLooks; ++i) {
        nodes.emplace(connection_, windows_);
        if (!watchAncestors(*nodes)) break;
    }

    xcb_connection_t* const x = connection_.get();
    const xcb_window_t root = connection_.screen().root;
    struct Question {
        std::vector<std::size_t> path;
        xcb_window_t window;
        xcb_translate_coordinates_cookie_t place;
        xcb_get_window_attributes_cookie_t state;
    };
    std::vector<Question> questions;
    for (const xcb_window_t window : windows_)
        if (nodes->exists(window))
            questions.push_back({nodes->pathTo(window), window, xcb_translate_coordinates(x, window, root, 0, 0),
                                 xcb_get_window_attributes(x, window)});
    const auto screenCookie = xcb_get_geometry(x, root);
    std::stable_sort(questions.begin(), questions.end(),
                     [](const Question& a, const Question& b) { return a.path < b.path; });
    Look look;
    for (const Question& question : questions) {
        const Owned<xcb_translate_coordinates_reply_t> place(
            xcb_translate_coordinates_reply(x, question.place, nullptr));
        const Owned<xcb_get_window_attributes_reply_t> state(
            xcb_get_window_attributes_reply(x, question.state, nullptr));
        if (!place || !state) continue;
        look.bottomToTop.push_back(
            {question.window, place->dst_x, place->dst_y, state->map_state == XCB_MAP_STATE_VIEWABLE});
    }
    const Owned<xcb_get_geometry_reply_t> screen(xcb_get_geometry_reply(x, screenCookie, nullptr));
    if (screen) look.screen = {0, 0, screen->width, screen->height};
    return look;
}

}  // namespace lumacast::x11
