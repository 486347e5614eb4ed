#pragma once

#include <atomic>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>

#include "client/Recorder.h"
#include "examples/self_recorder/CommandTable.h"
#include "examples/self_recorder/Loop.h"
#include "examples/self_recorder/Painter.h"
#include "examples/self_recorder/SceneWindow.h"
#include "examples/self_recorder/UniqueFd.h"

namespace lumacast::example {

/// The commands with which the application records its own window: start, broadcast, capture, pause, resume,
/// stop, clip, discard, state.
/// Connects to the daemon at the first of them. Lives on the loop; the library's answers are brought there.
class Recording final {
public:
    /// Borrows all four.
    Recording(Loop& loop, CommandTable& commands, SceneWindow& window, Painter& painter);
    ~Recording();
    Recording(const Recording&) = delete;
    Recording& operator=(const Recording&) = delete;

private:
    client::Recorder& recorder();
    /// Starts with these options, for this window.
    void start(client::StartOptions options, const Reply& reply);
    /// Runs `task` on the loop. Callable from any thread.
    void onLoop(std::function<void()> task);
    void runPosted();
    /// Answers once everything asked so far has reached the daemon, with the number of the frame shown then.
    void replyWhenHandled(const char* word, const Reply& reply);
    void replyStopped(const client::StopAnswer& answer, const Reply& reply);

    Loop& loop_;
    SceneWindow& window_;
    Painter& painter_;
    UniqueFd wake_;
    std::mutex mutex_;
    std::deque<std::function<void()>> posted_;
    std::atomic<std::uint64_t> pictures_{0}, sounds_{0};  ///< handed over
    std::unique_ptr<client::Recorder> recorder_;
};

}  // namespace lumacast::example
