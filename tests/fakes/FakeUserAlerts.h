#pragma once
#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <utility>
#include <vector>

#include "platform/Scheduler.h"
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
        : state_(std::make_shared<State>()), faults_(faults) {
        state_->queue = scheduler.serialQueue("user");
    }

    std::shared_ptr<UserAlert> show(const AlertContent& content) override {
        if (faults_.fails("UserAlerts.show")) return nullptr;
        auto alert = std::make_shared<Alert>(state_);
        User user;
        std::function<void()> whenShowing;
        {
            const std::lock_guard lock(state_->mutex);
            state_->shown.push_back(content);
            state_->standing.push_back({content, alert.get()});
            if (state_->standing.size() > state_->mostStanding) state_->mostStanding = state_->standing.size();
            user = state_->user;
            whenShowing = state_->whenShowing;
        }
        if (whenShowing) whenShowing();
        // The user takes a while: the answer comes later even when it is certain.
        if (user)
            state_->queue->async([weak = std::weak_ptr(alert), user, content] {
                const auto answered = weak.lock();
                const auto response = user(content);
                if (answered && response) answered->answer(*response);
            });
        return alert;
    }

    /// Who answers alerts from now on; nobody at first.
    void setUser(User user) {
        const std::lock_guard lock(state_->mutex);
        state_->user = std::move(user);
    }
    /// Called on the lane that shows an alert, while it does: the alert stands, but nobody has it yet.
    void setWhenShowing(std::function<void()> whenShowing) {
        const std::lock_guard lock(state_->mutex);
        state_->whenShowing = std::move(whenShowing);
    }
    /// Answers the oldest alert that stands; false when there is none.
    bool answer(Response response) {
        return withOldest([response](Alert& alert) { alert.answer(response); });
    }

    /// The oldest alert that stands ends as one that never got as far as the screen; false when there is none.
    bool failToShow() { return withOldest([](Alert& alert) { alert.failToShow(); }); }

    /// Every alert that was shown, oldest first.
    std::vector<AlertContent> shown() const {
        const std::lock_guard lock(state_->mutex);
        return state_->shown;
    }
    /// Whom the oldest alert that stands is about; none when there is none.
    std::optional<BundleIdentifier> standingAbout() const {
        const std::lock_guard lock(state_->mutex);
        return state_->standing.empty() ? std::nullopt : std::optional(state_->standing.front().content.application);
    }
    std::size_t standing() const {
        const std::lock_guard lock(state_->mutex);
        return state_->standing.size();
    }
    /// How many ever stood at the same time.
    std::size_t mostStanding() const {
        const std::lock_guard lock(state_->mutex);
        return state_->mostStanding;
    }

private:
    class Alert;
    struct Standing {
        AlertContent content;
        Alert* alert;
    };
    struct State {
        mutable std::mutex mutex;
        std::shared_ptr<SerialQueue> queue;
        User user;
        std::function<void()> whenShowing;
        std::vector<AlertContent> shown;
        std::vector<Standing> standing;
        std::size_t mostStanding = 0;
    };

    template <class Act>
    bool withOldest(const Act& act) {
        std::shared_ptr<Alert> alert;
        {
            const std::lock_guard lock(state_->mutex);
            if (state_->standing.empty()) return false;
            alert = state_->standing.front().alert->weak_from_this().lock();
        }
        if (alert) act(*alert);
        return alert != nullptr;
    }

    class Alert final : public UserAlert, public std::enable_shared_from_this<Alert> {
    public:
        explicit Alert(std::shared_ptr<State> state) : state_(std::move(state)) {}
        ~Alert() override { takeDown(); }
        void receiveResponse(std::function<void(Response)> handler) override {
            std::optional<Response> response;
            {
                const std::lock_guard lock(mutex_);
                handler_ = std::move(handler);
                response = response_;
            }
            if (response) tell();
        }
        void cancel() override { answer(Response::OtherButton); }
        bool wasShown() const override { return !failed_; }
        void failToShow() {
            failed_ = true;
            answer(Response::OtherButton);
        }
        void answer(Response response) {
            takeDown();
            {
                const std::lock_guard lock(mutex_);
                if (response_) return;
                response_ = response;
            }
            tell();
        }

    private:
        void takeDown() {
            const std::lock_guard lock(state_->mutex);
            std::erase_if(state_->standing, [this](const Standing& s) { return s.alert == this; });
        }
        void tell() {
            std::function<void(Response)> handler;
            Response response{};
            {
                const std::lock_guard lock(mutex_);
                if (!handler_) return;
                handler = std::exchange(handler_, nullptr);
                response = *response_;
            }
            state_->queue->async([handler = std::move(handler), response] { handler(response); });
        }

        const std::shared_ptr<State> state_;
        std::atomic<bool> failed_{false};
        std::mutex mutex_;
        std::function<void(Response)> handler_;
        std::optional<Response> response_;
    };

    const std::shared_ptr<State> state_;
    FaultPlan& faults_;
};

}  // namespace lumacast
