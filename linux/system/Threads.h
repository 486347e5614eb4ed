#pragma once
#include <functional>

namespace lumacast {

/// Starts a thread that nobody joins and that takes no signals (those belong to the termination thread): for work that
/// may hang in the system. `body` must own everything it touches and must not throw. False when no thread was to be
/// had.
[[nodiscard]] bool startDetachedThread(std::function<void()> body);

/// Runs `action` on a thread of its own that takes no signals and ends with it, waits for it, and answers its error
/// number: for what changes the thread itself (rights, priority). EAGAIN when no thread was to be had. `action` must
/// not throw.
[[nodiscard]] int performOnOwnThread(const std::function<int()>& action);

}  // namespace lumacast
