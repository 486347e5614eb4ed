#pragma once
// A daemon with an installed upload extension, for the tests of broadcasts.

#include <algorithm>
#include <memory>
#include <string>

#include "broadcast/ConfigurationArchive.h"
#include "tests/fakes/FakeUploader.h"
#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {

class BroadcastWorld : public DaemonWorld {
protected:
    void install(bool takesSamples, const std::string& identifier = "org.example.Uploader.upload") {
        fakes_.appExtensions.install(uploadExtension(plan_, takesSamples, identifier));
    }
    Data configuration(double clipDuration) {
        return *archiveOf(fakes_.keyedArchive, {clipDuration, Dictionary{{"AverageBitRate", 900000}}});
    }
    TestClient::AskedRef setUp(TestClient& client, const std::string& extension = "org.example.Uploader.setup",
                               const Data& archive = {}, const Value& userInfo = Dictionary{{"title", "Game night"}},
                               const std::string& host = {}) {
        auto asked = client.ask(DaemonMessage::SetupBroadcast,
                                {host.empty() ? client.id.text() : host, extension, archive, userInfo});
        settle();
        return asked;
    }
    TestClient::AskedRef startBroadcast(TestClient& client) {
        auto asked = client.start({client.window}, {.broadcast = true});
        settle();
        return asked;
    }
    /// A client that broadcasts.
    std::unique_ptr<TestClient> makeBroadcasting(bool samples) {
        install(samples);
        auto client = makeConnected();
        EXPECT_EQ(setUp(*client)->answers, 1);
        const auto start = startBroadcast(*client);
        EXPECT_EQ(start->answers, 1);
        EXPECT_EQ(start->code(), 0);
        fakes_.logSink.clear();
        return client;
    }
    std::shared_ptr<FakeAppExtension> extension() {
        const auto all = fakes_.appExtensions.extensions();
        return all.empty() ? nullptr : all.back();
    }
    Lines movies() {
        Lines all = fakes_.fileSystem.files();
        std::erase_if(all, [](const std::string& path) { return !path.ends_with(".mp4"); });
        return all;
    }
    int toldOf(const TestClient& client, ClientMessage message) {
        return static_cast<int>(std::count_if(client.told.begin(), client.told.end(),
                                              [&](const auto& told) { return told.message == message; }));
    }

    const std::shared_ptr<UploaderPlan> plan_ = std::make_shared<UploaderPlan>();
};

}  // namespace lumacast
