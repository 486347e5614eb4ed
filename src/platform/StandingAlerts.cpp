#include "platform/StandingAlerts.h"

namespace lumacast {

/// What stands, oldest first.
struct StandingAlerts::Alert::Shared {
    const std::shared_ptr<SerialQueue> queue;
    mutable std::mutex mutex;
    std::vector<Alert*> standing;
};

StandingAlerts::Alert::Alert(Key, std::shared_ptr<Shared> shared, const BundleIdentifier& about)
    : shared_(std::move(shared)), about_(about) {}

StandingAlerts::Alert::~Alert() {
    // What the handler holds may ask for alerts as it goes.
    handler_ = nullptr;
    takeDown();
}

void StandingAlerts::Alert::receiveResponse(std::function<void(Response)> handler) {
    {
        const std::lock_guard lock(mutex_);
        handler_ = std::move(handler);
    }
    tell();
}

bool StandingAlerts::Alert::wasShown() const {
    const std::lock_guard lock(mutex_);
    return wasShown_;
}

bool StandingAlerts::Alert::end(Response response, bool wasShown) {
    takeDown();
    {
        const std::lock_guard lock(mutex_);
        if (response_) return false;
        response_ = response;
        wasShown_ = wasShown;
    }
    tell();
    return true;
}

void StandingAlerts::Alert::takeDown() {
    const std::lock_guard lock(shared_->mutex);
    std::erase(shared_->standing, this);
}

/// Once there is both an answer and somebody who wants it.
void StandingAlerts::Alert::tell() {
    std::function<void(Response)> handler;
    Response response{};
    {
        const std::lock_guard lock(mutex_);
        if (!handler_ || !response_) return;
        handler = std::exchange(handler_, nullptr);
        response = *response_;
    }
    shared_->queue->async([handler = std::move(handler), response] { handler(response); });
}

StandingAlerts::StandingAlerts(std::shared_ptr<SerialQueue> queue)
    : shared_(new Alert::Shared{std::move(queue), {}, {}}) {}

StandingAlerts::Added StandingAlerts::add(const BundleIdentifier& about) {
    auto alert = std::make_shared<Alert>(Alert::Key(), shared_, about);
    const std::lock_guard lock(shared_->mutex);
    shared_->standing.push_back(alert.get());
    return {std::move(alert), shared_->standing.size()};
}

std::shared_ptr<StandingAlerts::Alert> StandingAlerts::oldest() const {
    const std::lock_guard lock(shared_->mutex);
    for (Alert* const each : shared_->standing)
        if (auto alert = each->weak_from_this().lock()) return alert;
    return nullptr;
}

bool StandingAlerts::answer(Response response) {
    // Somebody else may be faster, with one or the other.
    while (const auto alert = oldest())
        if (alert->answer(response)) return true;
    return false;
}

bool StandingAlerts::failToShow() {
    while (const auto alert = oldest())
        if (alert->failToShow()) return true;
    return false;
}

std::size_t StandingAlerts::count() const {
    const std::lock_guard lock(shared_->mutex);
    return shared_->standing.size();
}

}  // namespace lumacast
