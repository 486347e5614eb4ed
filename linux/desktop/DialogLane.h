#pragma once
// One alert's thread, and what it shares with those who wait for it.

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string_view>

#include "linux/desktop/DialogProcess.h"
#include "linux/desktop/DialogProgram.h"
#include "linux/desktop/DialogWatch.h"
#include "linux/display/Wake.h"
#include "platform/UserAlert.h"

namespace lumacast {

/// An alert's answer on its way to its handler. Thread-safe; nothing waits but `deliver`.
class AlertAnswer final {
public:
    using Response = UserAlert::Response;
    using Handler = std::function<void(Response)>;

    void receive(Handler handler);
    void cancel();
    /// Nobody wants to know any more: the handler is not called, unless it is being called.
    void abandon();
    void wake() const { wake_.signal(); }

    /// Readable when something has changed; cleared by whoever looks.
    const x11::Wake& changes() const { return wake_; }
    /// Cancelled or abandoned.
    bool over() const;
    void noteShown() { shown_ = true; }
    bool wasShown() const { return shown_; }
    /// Waits for the handler and calls it; returns at once when nobody wants to know. A cancelled alert's answer is the
    /// other button, whatever `response` says.
    void deliver(Response response);

private:
    const x11::Wake wake_;
    std::atomic<bool> shown_{false};
    mutable std::mutex mutex_;  // guards the rest
    std::condition_variable changed_;
    Handler handler_;
    bool cancelled_ = false;
    bool abandoned_ = false;
};

/// Asks the user, and delivers the answer.
class DialogLane final {
public:
    struct Question {
        DialogProgram program;
        DialogTexts texts;
        DialogProcess::Command command;
        std::chrono::milliseconds tooSoon, windowPatience;
        /// Told why the user has not been asked.
        std::function<void(std::string_view reason)> explain;
    };
    /// The thread that does it, and that the dialog dies with; it ends when the answer is delivered, and ends the
    /// watch. False when there is none to be had.
    [[nodiscard]] static bool start(std::shared_ptr<AlertAnswer> answer, std::shared_ptr<DialogWatch> watch,
                                    Question question);

private:
    using Response = UserAlert::Response;
    DialogLane(AlertAnswer& answer, DialogWatch& watch, const Question& question)
        : answer_(answer), watch_(watch), question_(question) {}
    Response ask();
    /// None for a grant that came too soon.
    std::optional<Response> askOnce();
    std::optional<DialogEnd> waitForEnd(DialogProcess& dialog);

    AlertAnswer& answer_;
    DialogWatch& watch_;
    std::string_view trouble_ = "the dialog program ended without showing a window";
    const Question& question_;
};

}  // namespace lumacast
