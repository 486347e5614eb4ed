#include "linux/system/SleepInhibitor.h"

#include <poll.h>
#include <pthread.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <mutex>
#include <thread>
#include <utility>

#include "linux/ipc/QuietThread.h"
#include "linux/system/LoginLocks.h"

namespace lumacast {

class SleepInhibitor::Lane final {
public:
    explicit Lane(Options options) : options_(std::move(options)) {}
    ~Lane() {
        {
            const std::lock_guard lock(mutex_);
            quit_ = true;
        }
        wake();
        if (thread_.joinable()) thread_.join();
    }
    Lane(const Lane&) = delete;
    Lane& operator=(const Lane&) = delete;

    void setBusy(bool busy) {
        {
            const std::lock_guard lock(mutex_);
            busy_ = busy;
            if (busy && !thread_.joinable() && wake_) start();
        }
        wake();
    }

private:
    using Moment = std::chrono::steady_clock::time_point;

    void wake() const {
        const std::uint64_t one = 1;
        (void)!::write(wake_.get(), &one, sizeof one);  // full means that it is awake already
    }

    /// Where the system has no thread left the device is simply not kept awake; the next busy moment tries again.
    void start() { thread_ = quietThreadIfAny([this] { run(); }); }

    void run() {
        pthread_setname_np(pthread_self(), "lc-inhibit");
        LoginLocks locks(options_.beforeSleep);
        Moment nextTry{};
        auto retry = options_.retry;
        while (true) {
            bool busy = false;
            {
                const std::lock_guard lock(mutex_);
                if (quit_) return;
                busy = busy_;
            }
            if (!busy) {
                locks.letGo();
                nextTry = {};
                retry = options_.retry;
            } else {
                keepConnected(locks, nextTry, retry);
            }
            waitForWork(locks, busy ? nextTry : Moment::max());
        }
    }

    void keepConnected(LoginLocks& locks, Moment& nextTry, std::chrono::milliseconds& retry) const {
        constexpr int kRarest = 10;  // a device without a bus is asked less and less often
        const auto now = std::chrono::steady_clock::now();
        if (!locks.isConnected() && now >= nextTry) {
            const bool isThere = locks.connect(options_.busAddress);
            nextTry = now + retry;
            retry = isThere ? options_.retry : std::min(retry * 2, options_.retry * kRarest);
        }
        if (locks.isConnected() && !locks.process()) locks.disconnect();
    }

    void waitForWork(const LoginLocks& locks, Moment nextTry) const {
        using std::chrono::milliseconds;
        pollfd waited[] = {{wake_.get(), POLLIN, 0}, {-1, 0, 0}};
        int limit = -1;
        if (locks.isConnected()) {
            waited[1] = {locks.descriptor(), static_cast<short>(locks.events()), 0};
            limit = locks.timeout();
        } else if (nextTry != Moment::max()) {
            const auto left = std::chrono::ceil<milliseconds>(nextTry - std::chrono::steady_clock::now());
            limit = static_cast<int>(std::max<milliseconds::rep>(left.count(), 0));
        }
        ::poll(waited, 2, limit);
        std::uint64_t count = 0;
        if (waited[0].revents != 0) (void)!::read(wake_.get(), &count, sizeof count);
    }

    const Options options_;
    const Fd wake_{::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)};
    std::mutex mutex_;  // guards the next three
    bool busy_ = false;
    bool quit_ = false;
    std::thread thread_;
};

SleepInhibitor::SleepInhibitor(Options options) : lane_(std::make_unique<Lane>(std::move(options))) {}
SleepInhibitor::~SleepInhibitor() = default;
void SleepInhibitor::setBusy(bool busy) {
    lane_->setBusy(busy);
}

}  // namespace lumacast
