#include "support/ThreadSchedulerQueue.h"

#include <utility>

namespace lumacast {

namespace {

/// A thread that waits for its turn in sync. Lives on that thread's stack.
struct Waiter {
    std::condition_variable wake;
    bool hasTurn = false;
};

/// Tasks a worker runs from one queue before it lets other queues have their turn.
constexpr int kTasksPerTurn = 64;

}  // namespace

/// Is itself what a worker runs for it: asking for one takes no memory.
struct ThreadSerialQueue::State final : ThreadPool::Job, std::enable_shared_from_this<State> {
    explicit State(std::shared_ptr<ThreadPool> threadPool) : pool(std::move(threadPool)) {}

    const std::shared_ptr<ThreadPool> pool;
    std::mutex mutex;
    std::deque<std::variant<Task, Waiter*>> work;
    bool held = false;
    std::atomic<std::thread::id> holder;

    void askForWorker() {
        pool->submit(QueuePriority::Default, shared_from_this());
    }

    /// The holder's turn is over: hands the queue on, or leaves it idle.
    void handOn() {
        {
            const std::lock_guard lock(mutex);
            holder = std::thread::id();
            if (work.empty()) {
                held = false;
                return;
            }
            if (Waiter** waiter = std::get_if<Waiter*>(&work.front())) {
                (*waiter)->hasTurn = true;
                (*waiter)->wake.notify_one();  // under the lock: the waiter is gone as soon as it sees its turn
                work.pop_front();
                return;
            }
        }
        askForWorker();
    }

    void run() override {
        holder = std::this_thread::get_id();
        for (int count = 0; count < kTasksPerTurn; ++count) {
            Task task;
            {
                const std::lock_guard lock(mutex);
                Task* next = work.empty() ? nullptr : std::get_if<Task>(&work.front());
                if (!next) break;
                task = std::move(*next);
                work.pop_front();
            }
            task();
        }
        handOn();
    }
};

ThreadSerialQueue::ThreadSerialQueue(std::string label, std::shared_ptr<ThreadPool> pool)
    : label_(std::move(label)), state_(std::make_shared<State>(std::move(pool))) {}

ThreadSerialQueue::~ThreadSerialQueue() = default;

void ThreadSerialQueue::async(Task task) {
    {
        const std::lock_guard lock(state_->mutex);
        state_->work.emplace_back(std::move(task));
        if (state_->held) return;
        state_->held = true;
    }
    state_->askForWorker();
}

void ThreadSerialQueue::sync(const Task& task) {
    if (isCurrent()) {
        task();
        return;
    }
    const std::shared_ptr<State> state = state_;
    {
        std::unique_lock lock(state->mutex);
        if (state->held) {
            const ThreadPool::Waiting waiting(*state->pool);
            Waiter waiter;
            state->work.emplace_back(&waiter);
            waiter.wake.wait(lock, [&] { return waiter.hasTurn; });
        }
        state->held = true;
        state->holder = std::this_thread::get_id();
    }
    task();
    state->handOn();
}

bool ThreadSerialQueue::isCurrent() const { return state_->holder == std::this_thread::get_id(); }

}  // namespace lumacast
