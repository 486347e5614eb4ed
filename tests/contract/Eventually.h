#pragma once
// Waiting for what another thread or process does.

#include <chrono>
#include <thread>

namespace lumacast {

/// Polls `condition` until it holds; whether it did before the bound.
template <class Condition>
[[nodiscard]] bool eventually(const Condition& condition, std::chrono::milliseconds bound = std::chrono::seconds(60)) {
    const auto end = std::chrono::steady_clock::now() + bound;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > end) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

}  // namespace lumacast
