#include "headless/user/SyntheticUserAlerts.h"

#include <mutex>
#include <utility>
#include <vector>

namespace lumacast::headless {

/// The alerts that were not answered yet, oldest first.
struct SyntheticUserAlerts::Standing {
    mutable std::mutex mutex;
    std::shared_ptr<SerialQueue> queue;
    std::vector<Alert*> alerts;
};

class SyntheticUserAlerts::Alert final : public UserAlert, public std::enable_shared_from_this<Alert> {
public:
    explicit Alert(std::shared_ptr<Standing> standing) : standing_(std::move(standing)) {
        const std::lock_guard lock(standing_->mutex);
        standing_->alerts.push_back(this);
    }
    ~Alert() override { takeDown(); }

    void receiveResponse(std::function<void(Response)> handler) override {
        {
            const std::lock_guard lock(mutex_);
            handler_ = std::move(handler);
        }
        tell();
    }
    void cancel() override { answer(Response::OtherButton); }
    /// Nobody saw it, but its answer is an answer: that of whoever configured it.
    bool wasShown() const override { return true; }

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
        const std::lock_guard lock(standing_->mutex);
        std::erase(standing_->alerts, this);
    }
    /// Once there is both an answer and somebody who wants it.
    void tell() {
        std::function<void(Response)> handler;
        Response response{};
        {
            const std::lock_guard lock(mutex_);
            if (!handler_ || !response_) return;
            handler = std::exchange(handler_, nullptr);
            response = *response_;
        }
        standing_->queue->async([handler = std::move(handler), response] { handler(response); });
    }

    const std::shared_ptr<Standing> standing_;
    std::mutex mutex_;
    std::function<void(Response)> handler_;
    std::optional<Response> response_;
};

std::optional<Consent> consentFrom(std::string_view text) {
    if (text == "refuse") return Consent::Refuse;
    if (text == "allow") return Consent::Allow;
    if (text == "wait") return Consent::Wait;
    return std::nullopt;
}

SyntheticUserAlerts::SyntheticUserAlerts(Consent consent, Scheduler& scheduler, Note note)
    : consent_(consent), note_(std::move(note)), standing_(std::make_shared<Standing>()) {
    standing_->queue = scheduler.serialQueue("synthetic user");
}

std::shared_ptr<UserAlert> SyntheticUserAlerts::show(const AlertContent& content) {
    auto alert = std::make_shared<Alert>(standing_);
    std::optional<Response> response;
    // Of each alert only the other button refuses.
    if (consent_ == Consent::Refuse) response = Response::OtherButton;
    if (consent_ == Consent::Allow) response = Response::DefaultButton;
    note_(content, response);
    if (response) alert->answer(*response);
    return alert;
}

std::size_t SyntheticUserAlerts::standing() const {
    const std::lock_guard lock(standing_->mutex);
    return standing_->alerts.size();
}

bool SyntheticUserAlerts::answer(Response response) {
    std::shared_ptr<Alert> alert;
    {
        const std::lock_guard lock(standing_->mutex);
        if (standing_->alerts.empty()) return false;
        alert = standing_->alerts.front()->weak_from_this().lock();
    }
    if (alert) alert->answer(response);
    return alert != nullptr;
}

}  // namespace lumacast::headless
