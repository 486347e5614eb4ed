#pragma once
// The serial queues of the thread scheduler.

#include <atomic>
#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <variant>

#include "platform/Scheduler.h"
#include "support/ThreadSchedulerPool.h"

namespace lumacast {

/// A serial queue without a thread of its own: a list of work that whoever holds the queue takes its turn from. It is
/// held by a pool worker, or by the thread that called sync: an idle queue is taken over at once, a busy one is handed
/// to the waiting thread when its turn has come, so a task given to sync always runs on its caller's thread.
class ThreadSerialQueue final : public SerialQueue {
public:
    ThreadSerialQueue(std::string label, std::shared_ptr<ThreadPool> pool);
    ~ThreadSerialQueue() override;

    const std::string& label() const override { return label_; }
    void async(Task task) override;
    void sync(const Task& task) override;
    bool isCurrent() const override;

private:
    struct State;

    const std::string label_;
    const std::shared_ptr<State> state_;  ///< outlives the queue while work is on its way
};

}  // namespace lumacast
