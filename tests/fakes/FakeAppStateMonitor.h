#pragma once
#include <map>
#include <mutex>

#include "platform/AppStateMonitor.h"
#include "platform/Scheduler.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// Applications in the states that the test sets. A failing call ("AppStateMonitor.applicationState") answers 0, or none, like
/// a desktop that does not answer in time. Thread-safe; outlives its updates.
class FakeAppStateMonitor final : public AppStateMonitor {
public:
    FakeAppStateMonitor(Scheduler& scheduler, FaultPlan& faults) : scheduler_(scheduler), faults_(faults) {}

    std::uint32_t applicationState(const BundleIdentifier& identifier) override {
        if (faults_.fails("AppStateMonitor.applicationState")) return 0;
        const std::lock_guard lock(mutex_);
        const auto found = states_.find(identifier);
        return found == states_.end() ? 0 : found->second;
    }
    std::optional<BundleIdentifier> frontmostApplication() override {
        if (faults_.fails("AppStateMonitor.frontmostApplication")) return std::nullopt;
        const std::lock_guard lock(mutex_);
        for (const auto& [identifier, state] : states_)
            if (state & kRunningForeground) return identifier;
        return std::nullopt;
    }
    std::optional<ProcessID> applicationProcess(const BundleIdentifier& identifier) override {
        if (faults_.fails("AppStateMonitor.applicationProcess")) return std::nullopt;
        const std::lock_guard lock(mutex_);
        const auto found = processes_.find(identifier);
        return found == processes_.end() ? std::nullopt : std::optional(found->second);
    }
    void setHandler(Handler handler) override {
        // Swapped, so that the old handler is released outside of the lock.
        const std::lock_guard lock(mutex_);
        handler_.swap(handler);
    }

    bool hasHandler() const {
        const std::lock_guard lock(mutex_);
        return handler_ != nullptr;
    }
    void setState(const BundleIdentifier& identifier, std::uint32_t state) {
        const std::lock_guard lock(mutex_);
        states_.insert_or_assign(identifier, state);
    }
    void setProcess(const BundleIdentifier& identifier, ProcessID process) {
        const std::lock_guard lock(mutex_);
        processes_.insert_or_assign(identifier, process);
    }
    /// Tells whoever is the handler when the update arrives on the main queue.
    void update(std::int64_t state, bool frontmost, ProcessID pid) {
        scheduler_.mainQueue().async([this, state, frontmost, pid] {
            Handler handler;
            {
                const std::lock_guard lock(mutex_);
                handler = handler_;
            }
            if (handler) handler(state, frontmost, pid);
        });
    }

private:
    Scheduler& scheduler_;
    FaultPlan& faults_;
    mutable std::mutex mutex_;
    std::map<BundleIdentifier, std::uint32_t> states_;
    std::map<BundleIdentifier, ProcessID> processes_;
    Handler handler_;
};

}  // namespace lumacast
