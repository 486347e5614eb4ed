#pragma once
// Where windows are on the screen, and which covers which.

#include <xcb/xcb.h>

#include <cstdint>
#include <set>
#include <span>
#include <vector>

#include "linux/display/DamageRegion.h"
#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// Looks windows up in the tree of windows, and has the server report what happens to the windows that they are in (a
/// window manager's frames, the root): their moves and changes of order arrive as structure events of this connection,
/// and are no one else's. Belongs to one thread; `look` waits for the server, about twice for each level of the tree.
class WindowTree final {
public:
    struct Place {
        xcb_window_t window = XCB_NONE;
        std::int32_t x = 0, y = 0;  ///< of its first pixel within the border, on the screen
        bool viewable = false;      ///< it and all it is in are mapped
    };
    struct Look {
        std::vector<Place> bottomToTop;  ///< without windows that don't exist
        PixelRect screen;                ///< empty when the server would not tell
    };

    explicit WindowTree(X11Connection& connection) : connection_(connection) {}
    ~WindowTree();
    WindowTree(const WindowTree&) = delete;
    WindowTree& operator=(const WindowTree&) = delete;

    /// The windows to look for, whose own events the caller sees to.
    void follow(std::vector<xcb_window_t> windows) { windows_ = std::move(windows); }
    Look look();

private:
    struct Node {
        xcb_window_t parent = XCB_NONE;
        std::vector<xcb_window_t> children;  ///< the lowest first
    };
    class Nodes;

    bool watchAncestors(const Nodes& nodes);
    bool isFollowed(xcb_window_t window) const;
    void select(xcb_window_t window, std::uint32_t events) const;

    X11Connection& connection_;
    std::vector<xcb_window_t> windows_;
    std::set<xcb_window_t> ancestors_;  ///< watched
};

}  // namespace lumacast::x11
