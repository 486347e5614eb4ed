#pragma once
// What the parts of the library share: the lane of the sockets, and the lane of the handler.

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <string_view>

#include "base/Log.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"

namespace lumacast::extension {

/// The calls of the handler, waiting for the thread that makes them.
class HandlerLane {
public:
    /// Any lane. Nothing is taken any more after finish().
    void call(std::function<void()> call) {
        {
            const std::lock_guard lock(mutex_);
            if (isFinished_) return;
            calls_.push_back(std::move(call));
        }
        changed_.notify_one();  // not within the lock, which is the first thing that the thread wants
    }
    /// Nothing follows what waits now. Any lane.
    void finish() {
        const std::lock_guard lock(mutex_);
        isFinished_ = true;
        changed_.notify_one();
    }
    /// Makes the calls until the last one before finish() has returned.
    void run() {
        std::unique_lock lock(mutex_);
        for (;;) {
            changed_.wait(lock, [this] { return isFinished_ || !calls_.empty(); });
            if (calls_.empty()) return;
            auto call = std::move(calls_.front());
            calls_.pop_front();
            lock.unlock();
            call();
            call = nullptr;  // what it held may be the completion of a payload
            lock.lock();
        }
    }
    bool isFinished() const {
        const std::lock_guard lock(mutex_);
        return isFinished_;
    }

private:
    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::deque<std::function<void()>> calls_;
    bool isFinished_ = false;
};

/// One line on standard error: something that came from the daemon was refused.
void sayRefused(const char* what);
/// A line of the library's log, on standard error: why a connection was dropped.
void sayLogged(LogLevel level, std::string_view text);

/// Kept by everything that may still want to send: an answer that its holder releases late finds no connection, but a lane.
class World {
public:
    Log log{sayLogged};
    Reactor reactor{"lumacast extension"};
    LinuxIpc ipc{reactor, log, {}};
    HandlerLane lane;
};

}  // namespace lumacast::extension
