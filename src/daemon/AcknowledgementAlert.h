#pragma once
// The question whether an application may record.

#include <memory>
#include <mutex>
#include <optional>
#include <string_view>

#include "platform/Platform.h"
#include "support/Localization.h"

namespace lumacast {

/// What decides the alert's texts.
struct AcknowledgementRequest {
    BundleIdentifier application;
    bool isCapturing = false;  ///< samples go to the application, not into a movie
    bool microphone = false;
    bool camera = false;
};

/// The alert's texts in the user's language. A text that is not installed is deliberately its key, so that
/// every button has one; an application without a name is its identifier. Answers within what the Bundles role takes.
AlertContent acknowledgementAlertContent(Localization& localization, const AcknowledgementRequest& request);

/// One alert: asked and waited for on the alert queue, taken down from the request lane. Asks once.
class AcknowledgementAlert final {
public:
    explicit AcknowledgementAlert(const Platform& platform) : platform_(platform) {}

    /// Shows the alert and waits for the user without limit: on the alert queue only. None when it can't be shown,
    /// or turns out not to have been; the other button, shown or not, when it was cancelled.
    std::optional<UserAlert::Response> ask(const AlertContent& content);
    /// Takes the alert down; one that is about to be shown may be seen for a moment. Any lane; does not block.
    void cancel();
    bool isCancelled() const;

private:
    const Platform platform_;
    mutable std::mutex mutex_;
    bool cancelled_ = false;
    std::shared_ptr<UserAlert> alert_;  ///< while it is waited for
};

}  // namespace lumacast
