#pragma once
// Whether anything is in front of a window.

#include <xcb/xcb.h>

#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// Whether every pixel of a window (its border aside) is on the screen as the window has it: it and all it is in are
/// mapped, it lies wholly within them and within the screen, and no other window is above it. A window's bounding box
/// counts, whatever its shape. Waits for the server, twice for each level of the tree; while nobody else has grabbed the
/// server the answer may be old when it comes.
bool isWhollyShown(X11Connection& connection, xcb_window_t window);

}  // namespace lumacast::x11
