#pragma once
#include <mutex>

#include "platform/KeepAlive.h"

namespace lumacast {

/// Counts the transactions. Thread-safe.
class FakeKeepAlive final : public KeepAlive {
public:
    void beginTransaction() override {
        const std::lock_guard lock(mutex_);
        ++begun_;
    }
    void endTransaction() override {
        const std::lock_guard lock(mutex_);
        if (++ended_ > begun_) endedWithoutBegin_ = true;
        if (ended_ == begun_) ++idle_;
    }

    /// How often the last open transaction has ended.
    int timesIdle() const {
        const std::lock_guard lock(mutex_);
        return idle_;
    }
    int begun() const {
        const std::lock_guard lock(mutex_);
        return begun_;
    }
    int ended() const {
        const std::lock_guard lock(mutex_);
        return ended_;
    }
    /// Transactions open now.
    int open() const {
        const std::lock_guard lock(mutex_);
        return begun_ - ended_;
    }
    /// Whether there was ever an end too many.
    bool endedWithoutBegin() const {
        const std::lock_guard lock(mutex_);
        return endedWithoutBegin_;
    }

private:
    mutable std::mutex mutex_;
    int idle_ = 0;
    int begun_ = 0;
    int ended_ = 0;
    bool endedWithoutBegin_ = false;
};

}  // namespace lumacast
