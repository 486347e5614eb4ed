#pragma once
// Questions to a disk that may never answer.

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <utility>

namespace lumacast {

/// Runs questions on threads of its own and gives up on those that take too long, so that a stuck disk costs its
/// callers their patience and nothing more. A stuck question keeps its thread; there are never more than
/// `maximumThreads`, and when all are stuck every further question fails after its patience without having been begun.
/// Threads are made when they are needed. Callable from any lane.
class DiskLane final {
public:
    explicit DiskLane(std::size_t maximumThreads = 4);
    /// Waits a moment (at most 2 s) for questions in progress, then leaves them to their threads. So a question must
    /// own everything it touches.
    ~DiskLane();
    DiskLane(const DiskLane&) = delete;
    DiskLane& operator=(const DiskLane&) = delete;

    /// The answer of `question`, or none when it did not come within `patience`; it may then still be running and its
    /// answer is dropped. `question` must not throw.
    template <class T>
    std::optional<T> ask(std::chrono::nanoseconds patience, std::function<T()> question) {
        const auto answer = std::make_shared<std::optional<T>>();
        if (!perform(patience, [answer, question = std::move(question)] { answer->emplace(question()); }))
            return std::nullopt;
        return std::move(*answer);
    }

    /// How many threads there are now, for tests.
    std::size_t threadCount() const;

private:
    struct State;
    struct Job;

    bool perform(std::chrono::nanoseconds patience, std::function<void()> work);
    static void work(const std::shared_ptr<State>& state);

    const std::shared_ptr<State> state_;
};

}  // namespace lumacast
