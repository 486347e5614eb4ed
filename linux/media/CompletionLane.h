#pragma once
#include <condition_variable>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>

namespace lumacast::media {

/// A standing thread on which is told what has no thread of its own: because its work is over, was refused, or because
/// the system had no thread for it. It sleeps nearly always. What is told must not wait for long: others come after it.
class CompletionLane final {
public:
    /// Throws std::system_error when the system has no thread: at the start of the process, where that is the end.
    CompletionLane();
    CompletionLane(const CompletionLane&) = delete;
    CompletionLane& operator=(const CompletionLane&) = delete;
    /// Waits until all that was posted is told. Not to be called on the lane itself.
    ~CompletionLane();

    /// Runs `completion` (may be null) on the lane, once, and lets go of it there. Any thread; waits for nothing.
    void post(std::function<void()> completion);

private:
    void run();

    std::mutex mutex_;
    std::condition_variable changed_;
    std::deque<std::function<void()>> waiting_;
    bool stopping_ = false;

    std::thread thread_;  ///< last: it uses the rest
};

}  // namespace lumacast::media
