#include "linux/ipc/Reactor.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <condition_variable>
#include <system_error>

namespace lumacast {

namespace {

constexpr std::uint64_t kWakeID = 0;
constexpr int kTasksPerTurn = 64;
constexpr std::chrono::milliseconds kTaskTimePerTurn{2};
constexpr std::size_t kEventsPerTurn = 64;
/// How long watches may run before tasks get their turn again.
constexpr std::chrono::milliseconds kWatchTimePerTurn{4};

/// Without these two descriptors there is no process to run: the one place that throws, before anything has started.
Fd required(int descriptor, const char* what) {
    if (descriptor < 0) throw std::system_error(errno, std::generic_category(), what);
    return Fd(descriptor);
}

}  // namespace

class Reactor::PendingTimer final : public Timer {
public:
    PendingTimer(Reactor& reactor, TimerKey key) : reactor_(reactor), key_(key) {}
    ~PendingTimer() override {
        Task dropped;
        const std::lock_guard lock(reactor_.mutex_);
        const auto found = reactor_.timers_.find(key_);
        if (found == reactor_.timers_.end()) return;
        dropped = std::move(found->second);
        reactor_.timers_.erase(found);
    }

private:
    Reactor& reactor_;
    const TimerKey key_;
};

Reactor::Reactor(std::string label)
    : label_(std::move(label)),
      epoll_(required(epoll_create1(EPOLL_CLOEXEC), "epoll_create1")),
      wake_(required(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK), "eventfd")) {
    // Edge-triggered: each write wakes once, and nobody has to read the counter back.
    epoll_event event{};
    event.events = EPOLLIN | EPOLLET;
    event.data.u64 = kWakeID;
    epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, wake_.get(), &event);
}

Reactor::~Reactor() {
    // A dropped task may hold the last reference to something that submits another one.
    for (;;) {
        std::deque<Task> tasks;
        std::map<TimerKey, Task> timers;
        {
            const std::lock_guard lock(mutex_);
            tasks.swap(tasks_);
            timers.swap(timers_);
        }
        if (tasks.empty() && timers.empty()) return;
    }
}

void Reactor::wakeLocked() {
    if (!sleeping_) return;
    sleeping_ = false;
    const std::uint64_t one = 1;
    [[maybe_unused]] const auto written = ::write(wake_.get(), &one, sizeof one);
}

void Reactor::async(Task task) {
    const std::lock_guard lock(mutex_);
    tasks_.push_back(std::move(task));
    wakeLocked();
}

void Reactor::sync(const Task& task) {
    if (isCurrent()) return task();
    struct {
        std::mutex mutex;
        std::condition_variable condition;
        bool done = false;
    } state;
    async([&] {
        task();
        const std::lock_guard lock(state.mutex);
        state.done = true;
        state.condition.notify_one();
    });
    std::unique_lock lock(state.mutex);
    state.condition.wait(lock, [&] { return state.done; });
}

bool Reactor::isCurrent() const { return thread_.load() == std::this_thread::get_id(); }

void Reactor::requestStop() {
    stop_ = true;
    const std::lock_guard lock(mutex_);
    wakeLocked();
}

std::unique_ptr<Reactor::Watch> Reactor::watch(int descriptor, std::uint32_t events, WatchTask task) {
    std::uint64_t id = 0;
    {
        const std::lock_guard lock(mutex_);
        id = nextID_++;
        watches_.emplace(id, std::make_shared<WatchTask>(std::move(task)));
    }
    auto result = std::make_unique<Watch>(*this, descriptor, id);
    epoll_event event{};
    event.events = events;
    event.data.u64 = id;
    if (epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, descriptor, &event) != 0) return nullptr;
    return result;
}

Reactor::Watch::~Watch() {
    std::shared_ptr<WatchTask> task;
    epoll_ctl(reactor_.epoll_.get(), EPOLL_CTL_DEL, descriptor_, nullptr);
    const std::lock_guard lock(reactor_.mutex_);
    const auto found = reactor_.watches_.find(id_);
    task = std::move(found->second);
    reactor_.watches_.erase(found);
}

void Reactor::Watch::setEvents(std::uint32_t events) {
    epoll_event event{};
    event.events = events;
    event.data.u64 = id_;
    epoll_ctl(reactor_.epoll_.get(), EPOLL_CTL_MOD, descriptor_, &event);
}

std::unique_ptr<Timer> Reactor::after(std::chrono::nanoseconds delay, Task task) {
    const std::lock_guard lock(mutex_);
    const TimerKey key{std::chrono::steady_clock::now() + delay, nextID_++};
    timers_.emplace(key, std::move(task));
    wakeLocked();
    return std::make_unique<PendingTimer>(*this, key);
}

void Reactor::run() {
    thread_ = std::this_thread::get_id();
    std::array<epoll_event, kEventsPerTurn> events;
    while (!stop_) {
        runTasks();
        runTimers();
        std::vector<std::uint64_t> again;
        again.swap(again_);
        const int count = epoll_wait(epoll_.get(), events.data(), events.size(), timeUntilNextTurn(!again.empty()));
        {
            const std::lock_guard lock(mutex_);
            sleeping_ = false;
        }
        tasksDue_ = std::chrono::steady_clock::now() + kWatchTimePerTurn;
        for (int i = 0; i < count && !stop_; ++i) {
            const std::uint64_t id = events[static_cast<std::size_t>(i)].data.u64;
            if (id == kWakeID) continue;
            if (!again.empty()) std::erase(again, id);
            runWatch(id, events[static_cast<std::size_t>(i)].events);
            runTasksIfDue();
        }
        for (const std::uint64_t id : again) {
            if (stop_) break;
            runWatch(id, 0);
            runTasksIfDue();
        }
    }
    thread_ = std::thread::id();
    stop_ = false;
}

void Reactor::runTasksIfDue() {
    if (std::chrono::steady_clock::now() < tasksDue_) return;
    runTasks();
    tasksDue_ = std::chrono::steady_clock::now() + kWatchTimePerTurn;
}

void Reactor::runTasks() {
    const Instant limit = std::chrono::steady_clock::now() + kTaskTimePerTurn;
    for (int i = 0; i < kTasksPerTurn && !stop_; ++i) {
        Task task;
        {
            const std::lock_guard lock(mutex_);
            if (tasks_.empty()) return;
            task = std::move(tasks_.front());
            tasks_.pop_front();
        }
        task();
        task = nullptr;
        if (std::chrono::steady_clock::now() >= limit) return;
    }
}

void Reactor::runTimers() {
    const Instant now = std::chrono::steady_clock::now();
    for (int i = 0; i < kTasksPerTurn && !stop_; ++i) {
        Task task;
        {
            const std::lock_guard lock(mutex_);
            if (timers_.empty() || timers_.begin()->first.first > now) return;
            task = std::move(timers_.begin()->second);
            timers_.erase(timers_.begin());
        }
        task();
    }
}

int Reactor::timeUntilNextTurn(bool workLeft) {
    const std::lock_guard lock(mutex_);
    if (workLeft || !tasks_.empty() || stop_) return 0;
    sleeping_ = true;
    if (timers_.empty()) return -1;
    using std::chrono::milliseconds;
    const auto left = std::chrono::ceil<milliseconds>(timers_.begin()->first.first - std::chrono::steady_clock::now());
    return static_cast<int>(std::clamp<std::int64_t>(left.count(), 0, 60'000));
}

void Reactor::runWatch(std::uint64_t id, std::uint32_t events) {
    std::shared_ptr<WatchTask> task;
    {
        const std::lock_guard lock(mutex_);
        const auto found = watches_.find(id);
        if (found == watches_.end()) return;
        task = found->second;
    }
    if ((*task)(events) == Again::Yes) again_.push_back(id);
}

}  // namespace lumacast
