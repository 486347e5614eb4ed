#include "linux/display/QuestionLane.h"

#include <poll.h>
#include <pthread.h>

#include <chrono>

#include "linux/ipc/QuietThread.h"

namespace lumacast::x11 {
namespace {

// A little less than what is promised to the caller.
constexpr std::chrono::milliseconds kPatience{90};

}  // namespace

QuestionLane::QuestionLane(std::string display, const char* threadName, QuestionLaneObserver* observer)
    : display_(std::move(display)), name_(threadName), observer_(observer), thread_(quietThread([this] { loop(); })) {}

QuestionLane::~QuestionLane() {
    {
        const std::lock_guard lock(mutex_);
        quit_ = true;
    }
    interrupt_.fire();
    wake_.signal();
    thread_.join();
}

bool QuestionLane::run(Question question) {
    const auto asked = std::make_shared<Asked>();
    asked->question = std::move(question);
    const auto limit = std::chrono::steady_clock::now() + kPatience;
    std::unique_lock lock(mutex_);
    if (quit_ || unanswered_ > 0) return false;
    asked_.push_back(asked);
    wake_.signal();
    if (answered_.wait_until(lock, limit, [&] { return asked->done; })) return true;
    asked->givenUp = true;
    ++unanswered_;
    return false;
}

void QuestionLane::later(Question question) {
    const auto asked = std::make_shared<Asked>();
    asked->question = std::move(question);
    {
        const std::lock_guard lock(mutex_);
        if (quit_) return;
        asked_.push_back(asked);
    }
    wake_.signal();
}

void QuestionLane::loop() {
    pthread_setname_np(pthread_self(), name_);
    while (true) {
        {
            const std::lock_guard lock(mutex_);
            if (quit_) break;
        }
        if (answerNext()) continue;
        sleep();
    }
    connection_.reset();
}

bool QuestionLane::answerNext() {
    std::shared_ptr<Asked> asked;
    bool wanted = false;
    {
        const std::lock_guard lock(mutex_);
        if (asked_.empty()) return false;
        asked = asked_.front();
        asked_.pop_front();
        wanted = !asked->givenUp;
    }
    if (wanted) {
        connect();
        asked->question(connection_.get());
    }
    asked->question = nullptr;
    {
        const std::lock_guard lock(mutex_);
        asked->done = true;
        if (asked->givenUp) --unanswered_;
    }
    answered_.notify_all();
    return true;
}

void QuestionLane::connect() {
    if (connection_ && !connection_->broken()) return;
    connection_.reset();
    connection_ = X11Connection::open(display_, interrupt_);
    if (connection_ && observer_ != nullptr) observer_->connected(*connection_);
}

void QuestionLane::sleep() {
    if (connection_ && connection_->broken()) connection_.reset();
    std::vector<int> others;
    bool mayHaveMore = false;
    if (observer_ != nullptr) {
        // Events that were read while waiting for a reply don't wake the descriptor again.
        if (connection_) mayHaveMore = observer_->takeEvents(*connection_);
        others = observer_->descriptors();
    }
    std::vector<pollfd> polled{{wake_.descriptor(), POLLIN, 0}};
    if (connection_) xcb_flush(connection_->get());
    polled.push_back({connection_ ? connection_->descriptor() : -1, POLLIN, 0});
    for (const int descriptor : others) polled.push_back({descriptor, POLLIN, 0});
    ::poll(polled.data(), polled.size(), mayHaveMore ? 0 : -1);
    if (polled[0].revents != 0) wake_.clear();
    if (polled[1].revents != 0) {
        if (observer_ != nullptr)
            observer_->takeEvents(*connection_);
        else
            while (Owned<xcb_generic_event_t>(xcb_poll_for_event(connection_->get()))) {
            }
    }
    for (std::size_t i = 2; i < polled.size(); ++i)
        if (polled[i].revents != 0) observer_->readable(polled[i].fd);
}

}  // namespace lumacast::x11
