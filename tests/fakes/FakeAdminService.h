#pragma once
#include <mutex>
#include <utility>

#include "platform/AdminService.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// An administrator inside the test. Thread-safe.
class FakeAdminService final : public AdminService {
public:
    explicit FakeAdminService(Scheduler& scheduler) : scheduler_(scheduler) {}

    void resume(std::function<Dictionary()> snapshot) override {
        const std::lock_guard lock(mutex_);
        snapshot_ = std::move(snapshot);
    }

    /// Asks for the status; `answer` is called on the main queue, after the snapshot was taken there. Nobody answers
    /// before the service was resumed: false then.
    bool ask(std::function<void(Dictionary)> answer) {
        std::function<Dictionary()> snapshot;
        {
            const std::lock_guard lock(mutex_);
            snapshot = snapshot_;
        }
        if (!snapshot) return false;
        scheduler_.mainQueue().async([snapshot, answer = std::move(answer)] { answer(snapshot()); });
        return true;
    }

private:
    Scheduler& scheduler_;
    std::mutex mutex_;
    std::function<Dictionary()> snapshot_;
};

}  // namespace lumacast
