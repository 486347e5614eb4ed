#include "headless/user/SyntheticUserAlerts.h"

#include <utility>

namespace lumacast::headless {

std::optional<Consent> consentFrom(std::string_view text) {
    if (text == "refuse") return Consent::Refuse;
    if (text == "allow") return Consent::Allow;
    if (text == "wait") return Consent::Wait;
    return std::nullopt;
}

SyntheticUserAlerts::SyntheticUserAlerts(Consent consent, Scheduler& scheduler, Note note)
    : consent_(consent), note_(std::move(note)), alerts_(scheduler.serialQueue("synthetic user")) {}

std::shared_ptr<UserAlert> SyntheticUserAlerts::show(const AlertContent& content) {
    const auto alert = alerts_.add(content.application).alert;
    std::optional<Response> response;
    // Of each alert only the other button refuses.
    if (consent_ == Consent::Refuse) response = Response::OtherButton;
    if (consent_ == Consent::Allow) response = Response::DefaultButton;
    note_(content, response);
    // Nobody saw it, but its answer is an answer: that of whoever configured it.
    if (response) alert->answer(*response);
    return alert;
}

}  // namespace lumacast::headless
