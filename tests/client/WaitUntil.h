#pragma once
#include <poll.h>

#include <chrono>
#include <functional>

namespace lumacast::test {

/// Asks again and again until `condition` holds; false when it did not within `limit`.
inline bool waitUntil(const std::function<bool()>& condition, std::chrono::seconds limit = std::chrono::seconds(60)) {
    const auto until = std::chrono::steady_clock::now() + limit;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > until) return false;
        ::poll(nullptr, 0, 5);
    }
    return true;
}

}  // namespace lumacast::test
