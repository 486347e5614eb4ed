#pragma once
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/Scheduler.h"
#include "platform/StoragePurgeService.h"

namespace lumacast {

/// The device's storage as the test wants it. Thread-safe.
class FakeStoragePurgeService final : public StoragePurgeService {
public:
    using Answer = std::function<void(std::optional<PurgeRecord>)>;

    explicit FakeStoragePurgeService(Scheduler& scheduler)
        : lane_(scheduler.serialQueue("storage purge")), state_(std::make_shared<State>()) {}

    void registerCallbacks(std::string service, StoragePurgeCallbacks callbacks) override {
        const std::lock_guard lock(state_->mutex);
        state_->service = std::move(service);
        state_->callbacks = std::move(callbacks);
        state_->urgency = 0;
    }
    void requestPurge(std::int32_t urgency, Answer answer) override {
        submit([urgency, answer = std::move(answer)](const StoragePurgeCallbacks& callbacks) {
            answer(callbacks.purge ? callbacks.purge(urgency) : std::nullopt);
        });
    }
    void requestPurgeableSpace(Answer answer) override {
        submit([answer = std::move(answer)](const StoragePurgeCallbacks& callbacks) {
            answer(callbacks.purgeableSpace ? std::optional(callbacks.purgeableSpace()) : std::nullopt);
        });
    }

    /// The free space is now as short as this urgency says; 0 for not short at all.
    void setShortage(std::int32_t urgency) {
        std::int32_t before = 0;
        {
            const std::lock_guard lock(state_->mutex);
            before = std::exchange(state_->urgency, urgency);
        }
        submit([before, urgency](const StoragePurgeCallbacks& callbacks) {
            if (urgency > before && callbacks.purge) (void)callbacks.purge(urgency);
            if (urgency == 0 && before > 0 && callbacks.cancelPurge) (void)callbacks.cancelPurge(before);
        });
    }
    /// A day has passed.
    void passDay(Answer answer = {}) {
        submit([answer = std::move(answer)](const StoragePurgeCallbacks& callbacks) {
            const auto record = callbacks.periodic ? std::optional(callbacks.periodic()) : std::nullopt;
            if (answer) answer(record);
        });
    }
    /// The name that was registered; empty for none.
    std::string service() const {
        const std::lock_guard lock(state_->mutex);
        return state_->service;
    }
    /// What was registered, for a test that calls it itself.
    StoragePurgeCallbacks callbacks() const {
        const std::lock_guard lock(state_->mutex);
        return state_->callbacks;
    }

private:
    struct State {
        mutable std::mutex mutex;
        std::string service;
        StoragePurgeCallbacks callbacks;
        std::int32_t urgency = 0;
    };

    void submit(std::function<void(const StoragePurgeCallbacks&)> task) {
        lane_->async([state = state_, task = std::move(task)] {
            StoragePurgeCallbacks callbacks;
            {
                const std::lock_guard lock(state->mutex);
                callbacks = state->callbacks;
            }
            task(callbacks);
        });
    }

    const std::shared_ptr<SerialQueue> lane_;
    const std::shared_ptr<State> state_;
};

}  // namespace lumacast
