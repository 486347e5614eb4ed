#pragma once
#include <functional>
#include <mutex>
#include <vector>

#include "platform/DisplayCapture.h"

namespace lumacast {

/// Records what it was told. Thread-safe.
class FakeDisplayCloneControl final : public DisplayCloneControl {
public:
    void setMirroringMode(int mode) override {
        if (whenSet_) whenSet_(mode);
        const std::lock_guard lock(mutex_);
        mode_ = mode;
        modes_.push_back(mode);
    }
    void setContexts(const std::set<ContextID>& contexts) override {
        const std::lock_guard lock(mutex_);
        contexts_ = contexts;
    }

    /// Called with each mode before it is set, on the lane that sets it. Set before the lanes run.
    void setWhenSet(std::function<void(int)> whenSet) { whenSet_ = std::move(whenSet); }
    int mode() const {
        const std::lock_guard lock(mutex_);
        return mode_;
    }
    std::set<ContextID> contexts() const {
        const std::lock_guard lock(mutex_);
        return contexts_;
    }
    /// Every mode that was set, in order.
    std::vector<int> modes() const {
        const std::lock_guard lock(mutex_);
        return modes_;
    }

private:
    std::function<void(int)> whenSet_;
    mutable std::mutex mutex_;
    int mode_ = kOff;
    std::set<ContextID> contexts_;
    std::vector<int> modes_;
};

}  // namespace lumacast
