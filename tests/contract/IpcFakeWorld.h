#pragma once
// Three processes of one machine in memory, in a simulation or on real threads.

#include <array>
#include <memory>

#include "base/Log.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/IpcWorld.h"
#include "tests/fakes/FakeIpc.h"
#include "tests/fakes/SimScheduler.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {

template <class SchedulerType>
class IpcFakeWorld final : public IpcWorld {
public:
    template <class... Arguments>
    explicit IpcFakeWorld(Arguments&&... arguments) : scheduler_(std::forward<Arguments>(arguments)...) {
        for (std::size_t i = 0; i < processes_.size(); ++i) {
            queues_[i] = scheduler_.serialQueue("process");
            processes_[i] = std::make_unique<FakeIpc>(machine_, queues_[i], pidAt(i), faults_, log_);
        }
    }
    ~IpcFakeWorld() override {
        if constexpr (std::is_same_v<SchedulerType, SimScheduler>) scheduler_.endWorld();
    }

    Ipc& ipc(Side side) override { return *processes_[at(side)]; }
    void on(Side side, const Task& task) override { queues_[at(side)]->sync(task); }
    bool isOnMainQueue(Side side) override { return queues_[at(side)]->isCurrent(); }
    void settle() override {
        if constexpr (std::is_same_v<SchedulerType, SimScheduler>) {
            scheduler_.runUntilIdle();
        } else {
            for (int i = 0; i < 8; ++i)
                for (const auto& queue : queues_) queue->sync([] {});
        }
    }
    ProcessID pid(Side side) override { return pidAt(at(side)); }
    void grant(Side side, const std::string& name, Value value) override {
        for (std::size_t i = 0; i < processes_.size(); ++i) processes_[at(side)]->grant(pidAt(i), name, value);
    }

private:
    static std::size_t at(Side side) { return static_cast<std::size_t>(side); }
    static ProcessID pidAt(std::size_t index) { return ProcessID{static_cast<std::int32_t>(100 + index)}; }

    FaultPlan faults_;
    Log log_;
    SchedulerType scheduler_;
    const std::shared_ptr<FakeIpcMachine> machine_ = std::make_shared<FakeIpcMachine>();
    std::array<std::shared_ptr<SerialQueue>, 3> queues_;
    std::array<std::unique_ptr<FakeIpc>, 3> processes_;
};

}  // namespace lumacast
