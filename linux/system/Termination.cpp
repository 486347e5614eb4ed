#include "linux/system/Termination.h"

#include <poll.h>
#include <pthread.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <system_error>

#include "linux/system/Threads.h"

namespace lumacast {

namespace {

sigset_t terminationSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    return signals;
}

/// Runs `work` on a thread of its own and waits for it at most `limit`, calling the beat meanwhile.
void runLimited(const std::function<void()>& work, std::chrono::milliseconds limit, const Termination::Beat& beat) {
    struct Progress {
        std::mutex mutex;
        std::condition_variable changed;
        bool done = false;
    };
    const auto progress = std::make_shared<Progress>();
    const bool started = startDetachedThread([progress, work] {
        work();
        const std::lock_guard lock(progress->mutex);
        progress->done = true;
        progress->changed.notify_all();
    });
    if (beat.call) beat.call();
    if (!started) return work();
    const auto deadline = std::chrono::steady_clock::now() + limit;
    std::unique_lock lock(progress->mutex);
    while (true) {
        const auto next = beat.call ? std::min(std::chrono::steady_clock::now() + beat.every, deadline) : deadline;
        if (progress->changed.wait_until(lock, next, [&] { return progress->done; })) return;
        if (next == deadline) return;
        lock.unlock();
        beat.call();
        lock.lock();
    }
}

}  // namespace

void blockTerminationSignals() {
    const sigset_t signals = terminationSignals();
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

Termination::Termination(std::function<void()> onTerminate, std::chrono::milliseconds limit, Beat beat) {
    blockTerminationSignals();
    const sigset_t signals = terminationSignals();
    signals_.reset(::signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
    end_.reset(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    if (!signals_ || !end_) return;
    try {
        thread_ = std::thread([this, onTerminate = std::move(onTerminate), limit, beat = std::move(beat)] {
            wait(onTerminate, limit, beat);
        });
    } catch (const std::system_error&) {
        // isWatching() tells.
    }
}

Termination::~Termination() {
    if (!thread_.joinable()) return;
    const std::uint64_t one = 1;
    (void)!::write(end_.get(), &one, sizeof one);  // an eventfd at 0 always takes a 1
    thread_.join();
}

void Termination::wait(const std::function<void()>& onTerminate, std::chrono::milliseconds limit,
                       const Beat& beat) const {
    pollfd waited[] = {{signals_.get(), POLLIN, 0}, {end_.get(), POLLIN, 0}};
    while (::poll(waited, 2, -1) < 0 && errno == EINTR) {}
    if (waited[1].revents != 0) return;
    runLimited(onTerminate, limit, beat);
    ::_exit(0);
}

}  // namespace lumacast
