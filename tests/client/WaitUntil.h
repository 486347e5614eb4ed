#pragma once
#include <poll.h>

#include <chrono>
#include <functional>

namespace lumacast::test {

/// Asks again and again until `condition` holds; false when it did not within a minute.
inline bool waitUntil(const std::function<bool()>& condition) {
    const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    while (!condition()) {
        if (std::chrono::steady_clock::now() > until) return false;
        ::poll(nullptr, 0, 2);
    }
    return true;
}

}  // namespace lumacast::test
