#pragma once
// The schedulers of which all of the contract must hold.

#include <gtest/gtest.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <thread>
#include <utility>

#include "linux/ipc/Reactor.h"
#include "support/ThreadScheduler.h"
#include "tests/fakes/SimScheduler.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast::test {

/// A scheduler whose main loop runs beside the test.
class SchedulerWorld {
public:
    virtual ~SchedulerWorld() = default;
    virtual Scheduler& scheduler() = 0;
    virtual std::shared_ptr<SerialQueue> sharedMainQueue() = 0;
    /// Waits until `condition` holds; whether it does within a generous bound. It may be evaluated on any lane.
    virtual bool until(const std::function<bool()>& condition) = 0;
    /// The time that this scheduler's waits and timers go by.
    virtual std::chrono::nanoseconds now() = 0;
};

class SimSchedulerWorld final : public SchedulerWorld {
public:
    explicit SimSchedulerWorld(std::uint64_t seed) : scheduler_(seed) {}
    Scheduler& scheduler() override { return scheduler_; }
    std::shared_ptr<SerialQueue> sharedMainQueue() override { return scheduler_.sharedMainQueue(); }
    bool until(const std::function<bool()>& condition) override { return scheduler_.runUntil(condition, std::chrono::hours(1)); }
    std::chrono::nanoseconds now() override { return std::chrono::nanoseconds(scheduler_.now().nanoseconds); }

private:
    SimScheduler scheduler_;
};

/// The shipped scheduler on the shipped main loop.
class PortSchedulerWorld final : public SchedulerWorld {
public:
    Scheduler& scheduler() override { return scheduler_; }
    std::shared_ptr<SerialQueue> sharedMainQueue() override { return loop_; }
    bool until(const std::function<bool()>& condition) override {
        const auto limit = std::chrono::steady_clock::now() + std::chrono::seconds(60);
        while (!condition()) {
            if (std::chrono::steady_clock::now() > limit) return false;
            std::this_thread::yield();
        }
        return true;
    }
    std::chrono::nanoseconds now() override { return std::chrono::steady_clock::now().time_since_epoch(); }

private:
    std::shared_ptr<Reactor> loop_ = std::make_shared<Reactor>();
    ThreadScheduler scheduler_{loop_};
    RunningThreadLoop running_{*loop_};
};

using SchedulerWorldMaker = std::function<std::unique_ptr<SchedulerWorld>()>;

class SchedulerContract : public ::testing::TestWithParam<SchedulerWorldMaker> {
protected:
    void global(Task task) { scheduler_.globalQueue(QueuePriority::Default).async(std::move(task)); }

    std::unique_ptr<SchedulerWorld> world_ = GetParam()();
    Scheduler& scheduler_ = world_->scheduler();
};

}  // namespace lumacast::test
