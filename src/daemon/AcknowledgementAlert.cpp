#include "daemon/AcknowledgementAlert.h"

#include <atomic>

namespace lumacast {

AlertContent acknowledgementAlertContent(Localization& localization, const AcknowledgementRequest& request) {
    const auto text = [&](std::string_view key) {
        return localization._lcLocalizedStringFromFrameworkBundleWithKey(key).value_or(std::string(key));
    };
    const std::string name = localization._lcLocalizedAppNameFromBundleID(request.application)
                                 .value_or(request.application.text());
    AlertContent content;
    content.application = request.application;
    content.header = Localization::filledIn(
        text(request.isCapturing ? "ACKNOWLEDGEMENT_CAPTURE_ALERT_TITLE" : "ACKNOWLEDGEMENT_ALERT_TITLE"), name);
    content.message =
        text(request.isCapturing ? "ACKNOWLEDGEMENT_CAPTURE_ALERT_BODY_TV" : "ACKNOWLEDGEMENT_ALERT_BODY_TV");
    if (request.camera || request.microphone)
        content.message +=
            " " + text(request.camera ? "ACKNOWLEDGEMENT_ALERT_BODY_CAMERA" : "ACKNOWLEDGEMENT_ALERT_BODY_MIC");
    // Deliberately the refusing text stands on a button that acknowledges when more than the screen is wanted.
    if (request.camera || request.microphone) {
        content.defaultButton = text("ACKNOWLEDGEMENT_ALERT_DECLINE_BUTTON");
        content.alternateButton = text(request.camera ? "ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_1_CAMERA"
                                                      : "ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_1");
        content.otherButton = text("ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_2");
    } else {
        content.defaultButton = text("ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_1_MICROPHONE_DISABLED");
        content.otherButton = text("ACKNOWLEDGEMENT_ALERT_DECLINE_BUTTON");
    }
    if (const auto bundle = localization._lcFrameworkBundle())
        content.localizationURL = URL::file(bundle->resourcePath());
    return content;
}

std::optional<UserAlert::Response> AcknowledgementAlert::ask(const AlertContent& content) {
    if (isCancelled()) return UserAlert::Response::OtherButton;
    const auto alert = platform_.userAlerts.show(content);
    if (!alert) return std::nullopt;
    struct Answer {
        std::unique_ptr<Semaphore> came;
        std::atomic<UserAlert::Response> response{UserAlert::Response::OtherButton};
    };
    const auto answer = std::make_shared<Answer>();
    answer->came = platform_.scheduler.semaphore(0);
    alert->receiveResponse([answer](UserAlert::Response response) {
        answer->response = response;
        answer->came->signal();
    });
    bool cancelled = false;
    {
        const std::lock_guard lock(mutex_);
        cancelled = cancelled_;
        if (!cancelled) alert_ = alert;
    }
    if (cancelled) alert->cancel();
    answer->came->wait();
    const std::lock_guard lock(mutex_);
    alert_ = nullptr;
    if (!cancelled_ && !alert->wasShown()) return std::nullopt;
    return answer->response;
}

void AcknowledgementAlert::cancel() {
    std::shared_ptr<UserAlert> alert;
    {
        const std::lock_guard lock(mutex_);
        cancelled_ = true;
        alert = alert_;
    }
    if (alert) alert->cancel();
}

bool AcknowledgementAlert::isCancelled() const {
    const std::lock_guard lock(mutex_);
    return cancelled_;
}

}  // namespace lumacast
