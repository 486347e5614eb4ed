#include "linux/desktop/DialogLane.h"

#include <poll.h>

#include <algorithm>
#include <array>
#include <utility>

#include "linux/system/Threads.h"

namespace lumacast {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

namespace {

/// How often the user is asked anew who always answers too soon.
constexpr int kMostTries = 5;
/// What a program may take to end whose window has gone: a press takes the window away before the program says which.
constexpr milliseconds kTimeToEnd{2'000};

}  // namespace

void AlertAnswer::receive(Handler handler) {
    {
        const std::lock_guard lock(mutex_);
        handler_ = std::move(handler);
    }
    changed_.notify_all();
}

void AlertAnswer::cancel() {
    {
        const std::lock_guard lock(mutex_);
        cancelled_ = true;
    }
    wake_.signal();
}

void AlertAnswer::abandon() {
    Handler unwanted;  // ends outside the lock
    {
        const std::lock_guard lock(mutex_);
        abandoned_ = true;
        unwanted = std::exchange(handler_, nullptr);
    }
    wake_.signal();
    changed_.notify_all();
}

bool AlertAnswer::over() const {
    const std::lock_guard lock(mutex_);
    return cancelled_ || abandoned_;
}

void AlertAnswer::deliver(Response response) {
    Handler handler;
    {
        std::unique_lock lock(mutex_);
        changed_.wait(lock, [this] { return handler_ || abandoned_; });
        if (abandoned_) return;
        if (cancelled_) response = Response::OtherButton;
        handler = std::exchange(handler_, nullptr);
    }
    handler(response);
}

bool DialogLane::start(std::shared_ptr<AlertAnswer> answer, std::shared_ptr<DialogWatch> watch, Question question) {
    return startDetachedThread([answer = std::move(answer), watch = std::move(watch), question = std::move(question)] {
        const Response response = DialogLane(*answer, *watch, question).ask();
        watch->stop();
        answer->deliver(response);
    });
}

UserAlert::Response DialogLane::ask() {
    std::optional<Response> response;
    for (int tries = 0; tries < kMostTries && !response; ++tries) response = askOnce();
    if (!answer_.wasShown() && !answer_.over() && question_.explain) question_.explain(trouble_);
    return response.value_or(Response::OtherButton);
}

std::optional<UserAlert::Response> DialogLane::askOnce() {
    const auto dialog = DialogProcess::start(question_.command);
    if (!dialog) {
        trouble_ = "the dialog program can't be run";
        return Response::OtherButton;
    }
    watch_.follow(dialog->pid());
    const auto end = waitForEnd(*dialog);
    const auto ended = steady_clock::now();
    if (watch_.seen()) answer_.noteShown();
    if (!end || answer_.over()) return Response::OtherButton;
    const Response response = responseOf(question_.program, question_.texts, *end);
    if (response == Response::OtherButton) return response;
    const auto seen = watch_.seen();
    if (!seen || ended - *seen < question_.tooSoon) return std::nullopt;
    return response;
}

std::optional<DialogEnd> DialogLane::waitForEnd(DialogProcess& dialog) {
    std::optional<steady_clock::time_point> deadline = steady_clock::now() + question_.windowPatience;
    bool lost = false;
    while (true) {
        if (answer_.over()) return std::nullopt;
        if (!lost && watch_.lost()) {
            lost = true;
            deadline = steady_clock::now() + kTimeToEnd;
        }
        if (!lost && watch_.seen()) deadline.reset();  // the user may take any time
        int timeout = -1;
        if (deadline) {
            const auto left = std::chrono::ceil<milliseconds>(*deadline - steady_clock::now());
            if (left <= milliseconds::zero()) {
                trouble_ = "the dialog program shows no window";
                return std::nullopt;
            }
            timeout = static_cast<int>(left.count());
        }
        std::array<pollfd, 3> polled{{{answer_.changes().descriptor(), POLLIN, 0},
                                      {dialog.descriptor(), POLLIN, 0},
                                      {dialog.output(), POLLIN, 0}}};
        if (::poll(polled.data(), polled.size(), timeout) < 0) continue;
        if (polled[0].revents != 0) answer_.changes().clear();
        if (polled[2].revents != 0 && !dialog.readOutput()) return std::nullopt;
        if (polled[1].revents != 0) return dialog.end();
    }
}

}  // namespace lumacast
