#pragma once
// Questions to the user.

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "base/Identifiers.h"
#include "base/URL.h"

namespace lumacast {

/// What an alert shows. Its texts are the user's language already.
struct AlertContent {
    /// Whom the alert is about: the platform shows its icon, so that a name alone deceives nobody.
    BundleIdentifier application;
    std::string header;
    std::string message;
    std::string defaultButton;
    std::optional<std::string> alternateButton, otherButton;
    /// Where the texts come from; none when that is unknown.
    std::optional<URL> localizationURL;
};

/// One alert on the screen. Destroying it takes it down.
class UserAlert {
public:
    /// What the user did. Everything that is not a press of the default or the alternate button is the other button:
    /// closing the alert, its program's or its display's death, `cancel`.
    enum class Response : std::uint8_t { DefaultButton = 0, AlternateButton = 1, OtherButton = 2 };

    virtual ~UserAlert() = default;
    /// Calls the handler once with the user's answer, which may never come; from a lane of the platform's, never inline.
    /// To be called once.
    virtual void receiveResponse(std::function<void(Response)> handler) = 0;
    /// Takes the alert down; it is answered with the other button unless it has been answered already. Any lane; does
    /// not block.
    virtual void cancel() = 0;
    /// Whether the user had it on the screen; known once it has been answered. Where something went wrong before that,
    /// the answer is the other button, but nobody's refusal.
    virtual bool wasShown() const = 0;
};

/// Makes alerts. Callable from any lane; may take as long as a program takes to start.
class UserAlerts {
public:
    virtual ~UserAlerts() = default;
    /// An alert that is being shown, without a time limit; null when none can be.
    virtual std::shared_ptr<UserAlert> show(const AlertContent& content) = 0;
};

}  // namespace lumacast
