#pragma once
// Alerts that nobody sees, for platforms whose user is a part of this process.

#include <cstddef>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

#include "platform/Scheduler.h"
#include "platform/UserAlert.h"

namespace lumacast {

/// Alerts that stand until somebody in this process answers them, or they are cancelled or destroyed. Handlers are called
/// on the queue. Thread-safe; alerts may outlive it.
class StandingAlerts final {
public:
    using Response = UserAlert::Response;

    class Alert final : public UserAlert, public std::enable_shared_from_this<Alert> {
    public:
        class Key {
            friend class StandingAlerts;
            Key() = default;
        };
        struct Shared;
        Alert(Key, std::shared_ptr<Shared> shared, const BundleIdentifier& about);
        ~Alert() override;

        void receiveResponse(std::function<void(Response)> handler) override;
        void cancel() override { answer(Response::OtherButton); }
        bool wasShown() const override;

        /// False for one that was answered before.
        bool answer(Response response) { return end(response, true); }
        /// It ends as one that nobody saw; false for one that was answered before.
        bool failToShow() { return end(Response::OtherButton, false); }
        const BundleIdentifier& about() const { return about_; }

    private:
        bool end(Response response, bool wasShown);
        void takeDown();
        void tell();

        const std::shared_ptr<Shared> shared_;
        const BundleIdentifier about_;
        mutable std::mutex mutex_;
        std::function<void(Response)> handler_;
        std::optional<Response> response_;
        bool wasShown_ = true;
    };

    explicit StandingAlerts(std::shared_ptr<SerialQueue> queue);

    struct Added {
        std::shared_ptr<Alert> alert;
        std::size_t standing;  ///< with it
    };
    Added add(const BundleIdentifier& about);

    /// The one that has stood for the longest time; null when there is none. One that is just being destroyed does not
    /// count.
    std::shared_ptr<Alert> oldest() const;
    /// Answers the oldest one; false when there is none.
    bool answer(Response response);
    /// The oldest one ends as one that nobody saw; false when there is none.
    bool failToShow();
    std::size_t count() const;

private:
    const std::shared_ptr<Alert::Shared> shared_;
};

}  // namespace lumacast
