#pragma once
#include <optional>
#include <span>
#include <vector>

#include "base/Identifiers.h"
#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// The process whose connection made the window, as the kernel told the display server; none when the server doesn't
/// know. Says nothing about whether the window exists. Waits for the server.
std::optional<ProcessID> ownerOf(X11Connection& connection, xcb_window_t window);
/// The owners of several windows, without doubles.
std::vector<ProcessID> ownersOf(X11Connection& connection, std::span<const xcb_window_t> windows);

}  // namespace lumacast::x11
