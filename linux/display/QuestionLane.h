#pragma once
// Questions to the display server from lanes that must not wait for it.

#include <atomic>
#include <condition_variable>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "linux/display/Wake.h"
#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// What a question lane does between questions. All calls come on the lane.
class QuestionLaneObserver {
public:
    virtual ~QuestionLaneObserver() = default;
    /// A new connection is there; nothing of an older one counts any more.
    virtual void connected(X11Connection& connection) = 0;
    /// Takes the events that have come. True when there were some: with the answers of what it then asked the server, more
    /// may have been read.
    virtual bool takeEvents(X11Connection& connection) = 0;
    /// More descriptors to wait for; and one of them is readable.
    virtual std::vector<int> descriptors() = 0;
    virtual void readable(int descriptor) = 0;
};

/// A thread with its own connection to the display server, made when first needed and again when the server has gone. A
/// question is answered within 100 ms or not at all; a server that has not answered one yet is not asked another.
/// Thread-safe.
class QuestionLane final {
public:
    /// What is asked: on the lane, where it may wait for the server; null when there is no server.
    using Question = std::function<void(X11Connection* connection)>;

    /// The observer is borrowed; null for none.
    QuestionLane(std::string display, const char* threadName, QuestionLaneObserver* observer = nullptr);
    /// Ends the lane, also when it waits for a server that hangs.
    ~QuestionLane();
    QuestionLane(const QuestionLane&) = delete;
    QuestionLane& operator=(const QuestionLane&) = delete;

    /// The answer, or `otherwise` when there is none in time. `question` must own what it uses: it may still run later.
    template <class Answer>
    Answer ask(std::function<Answer(X11Connection&)> question, Answer otherwise) {
        struct Shared {
            std::mutex mutex;
            Answer answer;
        };
        const auto shared = std::make_shared<Shared>();
        shared->answer = otherwise;
        const bool answered = run([question = std::move(question), shared](X11Connection* connection) {
            if (connection == nullptr) return;
            Answer answer = question(*connection);
            if (connection->broken()) return;
            const std::lock_guard lock(shared->mutex);
            shared->answer = std::move(answer);
        });
        if (!answered) return otherwise;
        const std::lock_guard lock(shared->mutex);
        return std::move(shared->answer);
    }
    /// Runs it on the lane as soon as that is free, without waiting.
    void later(Question question);

private:
    struct Asked {
        Question question;
        bool done = false;
        bool givenUp = false;
    };
    bool run(Question question);
    void loop();
    bool answerNext();
    void connect();
    void sleep();

    const std::string display_;
    const char* const name_;
    QuestionLaneObserver* const observer_;
    const Wake wake_;
    Interrupt interrupt_;
    std::mutex mutex_;  // guards the next four
    std::condition_variable answered_;
    std::deque<std::shared_ptr<Asked>> asked_;
    bool quit_ = false;
    int unanswered_ = 0;  ///< questions that nobody waits for any more and the server has not answered

    std::unique_ptr<X11Connection> connection_;  // of the lane alone
    std::thread thread_;
};

}  // namespace lumacast::x11
