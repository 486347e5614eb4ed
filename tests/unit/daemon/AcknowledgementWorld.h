#pragma once
// Starts that the user is asked about.

#include <string>
#include <utility>
#include <vector>

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {

/// A daemon that asks the user, and a user who answers as the test says.
class AcknowledgementWorld : public DaemonWorld {
protected:
    using Response = UserAlert::Response;

    AcknowledgementWorld() : AcknowledgementWorld(&installTexts) {}
    explicit AcknowledgementWorld(void (*prepare)(FakePlatform&)) : DaemonWorld(prepare) {
        fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", false);
    }
    /// Texts that show where they stand.
    static void installTexts(FakePlatform& fakes) {
        FakeBundle framework;
        framework.path = fakes.bundles.frameworkBundlePath();
        auto& texts = framework.tables["Localizable"];
        for (const char* key : {"ACKNOWLEDGEMENT_ALERT_BODY_TV", "ACKNOWLEDGEMENT_CAPTURE_ALERT_BODY_TV",
                                "ACKNOWLEDGEMENT_ALERT_BODY_CAMERA", "ACKNOWLEDGEMENT_ALERT_BODY_MIC",
                                "ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_1_MICROPHONE_DISABLED",
                                "ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_1", "ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_1_CAMERA",
                                "ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_2", "ACKNOWLEDGEMENT_ALERT_DECLINE_BUTTON"})
            texts[key] = std::string("text of ") + key;
        texts["ACKNOWLEDGEMENT_ALERT_TITLE"] = "Record %@?";
        texts["ACKNOWLEDGEMENT_CAPTURE_ALERT_TITLE"] = "Capture %@?";
        fakes.bundles.install(std::move(framework));
    }
    static std::string textOf(const std::string& key) { return "text of ACKNOWLEDGEMENT_ALERT_" + key; }
    void always(Response response) {
        fakes_.userAlerts.setUser([response](const AlertContent&) { return response; });
    }
    TestClient::AskedRef started(TestClient& client, TestClient::Flags flags = {}) {
        fakes_.logSink.clear();
        auto asked = client.start({client.window}, flags);
        settle();
        return asked;
    }
    void answer(Response response) {
        ASSERT_TRUE(fakes_.userAlerts.answer(response));
        settle();
    }
    bool isExempt(const TestClient& client) {
        bool result = false;
        world_.scheduler.mainQueue().sync(
            [&] { result = process_->manager().isExemptFromAcknowledgementAlertSession(*session(client)); });
        return result;
    }
    std::vector<AlertContent> shown() const { return fakes_.userAlerts.shown(); }
};

}  // namespace lumacast
