#pragma once
#include <atomic>
#include <chrono>
#include <thread>

namespace lumacast {

/// For what is sure to come.
inline constexpr std::chrono::seconds kPatience{30};

/// Waits until `condition` holds, as long as that; whether it does.
template <class Condition>
bool until(Condition condition) {
    const auto deadline = std::chrono::steady_clock::now() + kPatience;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > deadline) return false;
        std::this_thread::yield();
    }
    return true;
}

/// A gate that questions to a disk wait at: while it is shut, the disk hangs.
class Gate {
public:
    void shut() { open_ = false; }
    void open() { open_ = true; }
    void pass() {
        ++arrived_;
        while (!open_) std::this_thread::yield();
    }
    int arrived() const { return arrived_; }

private:
    std::atomic<bool> open_{true};
    std::atomic<int> arrived_{0};
};

}  // namespace lumacast
