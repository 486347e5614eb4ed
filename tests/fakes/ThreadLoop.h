#pragma once
#include <atomic>
#include <condition_variable>
#include <deque>
#include <mutex>
#include <string>
#include <thread>

#include "platform/Scheduler.h"

namespace lumacast {

/// A main queue that waits for nothing but its tasks: what a test gives the thread scheduler instead of the port's
/// reactor. run() on one thread at a time; everything else from any.
class ThreadLoop final : public MainLoop {
public:
    const std::string& label() const override { return label_; }
    void async(Task task) override;
    void sync(const Task& task) override;
    bool isCurrent() const override { return runner_ == std::this_thread::get_id(); }
    /// Runs tasks until requestStop; tasks that are left stay for the next run.
    void run() override;
    void requestStop() override;

private:
    const std::string label_ = "main";
    std::mutex mutex_;
    std::condition_variable wake_;
    std::deque<Task> tasks_;
    bool stopping_ = false;
    std::atomic<std::thread::id> runner_;
};

/// A main loop that runs on a thread of its own for as long as the object lives.
class RunningThreadLoop final {
public:
    explicit RunningThreadLoop(MainLoop& loop) : loop_(loop), thread_([this] { loop_.run(); }) {}
    ~RunningThreadLoop() {
        loop_.requestStop();
        thread_.join();
    }
    RunningThreadLoop(const RunningThreadLoop&) = delete;
    RunningThreadLoop& operator=(const RunningThreadLoop&) = delete;

private:
    MainLoop& loop_;
    std::thread thread_;
};

}  // namespace lumacast
