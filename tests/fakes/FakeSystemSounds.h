#pragma once
#include <mutex>
#include <vector>

#include "platform/SystemSounds.h"

namespace lumacast {

/// Keeps what was played. Thread-safe.
class FakeSystemSounds final : public SystemSounds {
public:
    void play(std::uint32_t sound) override {
        const std::lock_guard lock(mutex_);
        played_.push_back(sound);
    }
    /// Since the last forget().
    std::vector<std::uint32_t> played() const {
        const std::lock_guard lock(mutex_);
        return played_;
    }
    void forget() {
        const std::lock_guard lock(mutex_);
        played_.clear();
    }

private:
    mutable std::mutex mutex_;
    std::vector<std::uint32_t> played_;
};

}  // namespace lumacast
