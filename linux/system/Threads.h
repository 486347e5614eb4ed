#pragma once
#include <functional>

namespace lumacast {

/// Starts a thread that nobody joins and that takes no signals (those belong to the termination thread): for work that
/// may hang in the system. `body` must own everything it touches and must not throw. False when no thread was to be
/// had.
[[nodiscard]] bool startDetachedThread(std::function<void()> body);

}  // namespace lumacast
