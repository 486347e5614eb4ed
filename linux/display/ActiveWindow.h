#pragma once
// Which window the user works in.

#include <optional>
#include <vector>

#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// Looks at the windows of one connection. Belongs to its thread; everything waits for the server.
class ActiveWindow final {
public:
    explicit ActiveWindow(X11Connection& connection);

    /// What the window manager says is active, or without a window manager the topmost window that is shown; none when
    /// nothing is.
    xcb_window_t current();
    /// The windows of applications: those that the window manager knows, or without one all that are shown.
    std::vector<xcb_window_t> applicationWindows();

    /// Lets events come that may mean another active window, or no longer.
    void watch(bool wanted);
    /// What an event may mean; Windows also another active one.
    enum class Change { None, Active, Windows };
    Change meaningOf(const xcb_generic_event_t& event) const;

private:
    bool hasWindowManager();
    std::vector<xcb_window_t> windowsIn(xcb_atom_t property, std::uint32_t most);
    xcb_window_t windowIn(xcb_window_t of, xcb_atom_t property);
    std::vector<xcb_window_t> shownWindows();

    X11Connection& connection_;
    const xcb_atom_t activeWindow_;
    const xcb_atom_t clientList_;
    const xcb_atom_t managerCheck_;
};

}  // namespace lumacast::x11
