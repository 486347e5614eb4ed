#pragma once
#include <algorithm>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

#include "platform/Scheduler.h"
#include "platform/StandingAlerts.h"
#include "platform/UserAlert.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// Alerts that the test answers, or that answer themselves. A failing call ("UserAlerts.show") can't show one.
/// Thread-safe. Handlers are called on a queue of its own, as another program's answer would come.
class FakeUserAlerts final : public UserAlerts {
public:
    using Response = UserAlert::Response;
    /// What becomes of an alert that nobody holds back: the user's answer, or none for one that is left standing.
    using User = std::function<std::optional<Response>(const AlertContent&)>;

    FakeUserAlerts(Scheduler& scheduler, FaultPlan& faults)
        : queue_(scheduler.serialQueue("user")), faults_(faults), alerts_(queue_) {}

    std::shared_ptr<UserAlert> show(const AlertContent& content) override {
        if (faults_.fails("UserAlerts.show")) return nullptr;
        auto [alert, standing] = alerts_.add(content.application);
        User user;
        std::function<void()> whenShowing;
        {
            const std::lock_guard lock(mutex_);
            shown_.push_back(content);
            mostStanding_ = std::max(mostStanding_, standing);
            user = user_;
            whenShowing = whenShowing_;
        }
        if (whenShowing) whenShowing();
        // The user takes a while: the answer comes later even when it is certain.
        if (user)
            queue_->async([weak = std::weak_ptr(alert), user, content] {
                const auto answered = weak.lock();
                const auto response = user(content);
                if (answered && response) answered->answer(*response);
            });
        return alert;
    }

    /// Who answers alerts from now on; nobody at first.
    void setUser(User user) {
        const std::lock_guard lock(mutex_);
        user_ = std::move(user);
    }
    /// Called on the lane that shows an alert, while it does: the alert stands, but nobody has it yet.
    void setWhenShowing(std::function<void()> whenShowing) {
        const std::lock_guard lock(mutex_);
        whenShowing_ = std::move(whenShowing);
    }
    /// Answers the oldest alert that stands; false when there is none.
    bool answer(Response response) { return alerts_.answer(response); }
    /// The oldest alert that stands ends as one that never got as far as the screen; false when there is none.
    bool failToShow() { return alerts_.failToShow(); }

    /// Every alert that was shown, oldest first.
    std::vector<AlertContent> shown() const {
        const std::lock_guard lock(mutex_);
        return shown_;
    }
    /// Whom the oldest alert that stands is about; none when there is none.
    std::optional<BundleIdentifier> standingAbout() const {
        const auto oldest = alerts_.oldest();
        return oldest ? std::optional(oldest->about()) : std::nullopt;
    }
    std::size_t standing() const { return alerts_.count(); }
    /// How many ever stood at the same time.
    std::size_t mostStanding() const {
        const std::lock_guard lock(mutex_);
        return mostStanding_;
    }

private:
    const std::shared_ptr<SerialQueue> queue_;
    FaultPlan& faults_;
    StandingAlerts alerts_;
    mutable std::mutex mutex_;
    User user_;
    std::function<void()> whenShowing_;
    std::vector<AlertContent> shown_;
    std::size_t mostStanding_ = 0;
};

}  // namespace lumacast
