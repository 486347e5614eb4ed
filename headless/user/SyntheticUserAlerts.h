#pragma once
// The user of a machine without one.

#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/Scheduler.h"
#include "platform/StandingAlerts.h"
#include "platform/UserAlert.h"

namespace lumacast::headless {

/// What becomes of every alert.
enum class Consent : std::uint8_t {
    Refuse,  ///< the other button, at once
    Allow,   ///< the default button, at once
    Wait,    ///< nobody answers: the alert stands until it is taken down
};

/// "refuse", "allow" or "wait"; none for anything else.
std::optional<Consent> consentFrom(std::string_view text);

/// Alerts that nobody sees, answered by configuration. Handlers are called on a queue of its own. Thread-safe.
class SyntheticUserAlerts final : public UserAlerts {
public:
    using Response = UserAlert::Response;
    /// Told of each alert and what it was answered with (none: it is left standing), on the lane that shows it.
    using Note = std::function<void(const AlertContent& content, std::optional<Response> response)>;

    SyntheticUserAlerts(Consent consent, Scheduler& scheduler, Note note);

    std::shared_ptr<UserAlert> show(const AlertContent& content) override;

    /// How many stand there.
    std::size_t standing() const { return alerts_.count(); }
    /// Answers the oldest alert that stands; false when there is none.
    bool answer(Response response) { return alerts_.answer(response); }

private:
    const Consent consent_;
    const Note note_;
    StandingAlerts alerts_;
};

}  // namespace lumacast::headless
