#include "daemon/LCClientProxy.h"

#include <gtest/gtest.h>

#include <cstring>
#include <functional>

#include "tests/fakes/FakePlane.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {
namespace {

/// The eight messages with arguments of each, and the two lines of each.
struct Case {
    ClientMessage message;
    std::function<void(LCClientProxy&)> call;
    Array arguments;
    std::string entryLine, errorLine;
};

const Error kError("com.orvane.Lumacast.LCRecordingErrorDomain", -5806, {{"LocalizedDescription", "text"}});
const Data kTiming(72, 3), kFormat(40, 4), kSound{1, 2, 3, 4, 5};

std::vector<Case> cases() {
    const std::string refused = " error getting remote proxy: 32";
    return {
        {ClientMessage::UpdateScreenRecordingState,
         [](auto& p) { p.updateScreenRecordingState(true); },
         {true},
         "LCClientProxy:updateScreenRecordingState:",
         "LCClientProxy:updateScreenRecordingState:" + refused},
        {ClientMessage::StopRecordingWithError,
         [](auto& p) { p.stopRecordingWithError(kError, std::nullopt); },
         {kError, Value()},
         "LCClientProxy:stopRecordingWithError:movieURL:",
         "LCClientProxy:recordingDidStopWithError:" + refused},
        {ClientMessage::UpdateBroadcastServiceInfo,
         [](auto& p) {
             p.updateBroadcastServiceInfo(Dictionary{{"viewers", std::int64_t{3}}});
         },
         {Dictionary{{"viewers", std::int64_t{3}}}},
         "LCClientProxy:updateBroadcastServiceInfo:",
         "LCClientProxy:updateBroadcastServiceInfo:" + refused},
        {ClientMessage::UpdateBroadcastURL,
         [](auto& p) { p.updateBroadcastURL(URL("https://example.org/live")); },
         {URL("https://example.org/live")},
         "LCClientProxy:updateBroadcastURL:",
         "LCClientProxy:updateBroadcastURL:" + refused},
        {ClientMessage::CaptureHandlerWithSample,
         [](auto& p) { p.captureHandlerWithSample(nullptr, kTiming); },
         {Value(), kTiming},
         "LCClientProxy:captureHandlerWithSample:",
         "LCClientProxy:captureHandlerWithSample:" + refused},
        {ClientMessage::CaptureHandlerWithAudioSample,
         [](auto& p) { p.captureHandlerWithAudioSample(kSound, kFormat, 1024, 2, kTiming); },
         {kSound, kFormat, std::int64_t{1024}, std::int64_t{2}, kTiming},
         "LCClientProxy:captureHandlerWithAudioSample:",
         "LCClientProxy:captureHandlerWithAudioSample:" + refused},
        {ClientMessage::RecordingLockInterrupted,
         [](auto& p) { p.recordingLockInterrupted("locked"); },
         {"locked"},
         "LCClientProxy:recordingLockInterrupted:",
         "LCClientProxy:recodingDidStopAndSavedToCameraRoll: video saved to camera roll: 32"},
        {ClientMessage::RecordingTimerDidUpdate,
         [](auto& p) { p.recordingTimerDidUpdate(12.5); },
         {12.5},
         "LCClientProxy:recordingTimerDidUpdate:",
         "LCClientProxy:recordingTimerDidUpdate:" + refused},
    };
}

class LCClientProxyTest : public ::testing::Test, public IpcListenerDelegate, public IpcExportedObject {
protected:
    LCClientProxyTest() {
        fakes_.log.setVerbose(true);
        listener_ = fakes_.ipc.listenerForService("service");
        listener_->setDelegate(self_);
        listener_->resume();
        client_ = fakes_.makeProcess(ProcessID{500});
        clientEnd_ = client_->connectToService("service");
        clientEnd_->setExportedInterface(clientProtocol());
        clientEnd_->setExportedObject(self_);
        clientEnd_->resume();
        world_.scheduler.runUntilIdle();
        fakes_.logSink.clear();
    }
    ~LCClientProxyTest() override { world_.scheduler.endWorld(); }

    bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
        daemonEnd_ = connection;
        connection->setRemoteInterface(clientProtocol());
        connection->resume();
        return true;
    }
    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t message, Array arguments,
                        IpcReply) override {
        received_.emplace_back(static_cast<ClientMessage>(message), std::move(arguments));
    }

    /// The test itself, for those who hold it weakly.
    const std::shared_ptr<LCClientProxyTest> self_{this, [](LCClientProxyTest*) {}};
    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    std::shared_ptr<IpcListener> listener_;
    std::unique_ptr<FakeIpc> client_;
    std::shared_ptr<IpcConnection> clientEnd_, daemonEnd_;
    std::vector<std::pair<ClientMessage, Array>> received_;
};

TEST_F(LCClientProxyTest, EachMessageReachesTheClientWithItsValuesUnchanged) {
    ASSERT_TRUE(daemonEnd_);
    LCClientProxy proxy(fakes_.log, BundleIdentifier("org.example.Player"), daemonEnd_);
    EXPECT_EQ(proxy.bundleIdentifier(), BundleIdentifier("org.example.Player"));
    EXPECT_EQ(proxy.connection(), daemonEnd_);
    for (const Case& c : cases()) {
        received_.clear();
        fakes_.logSink.clear();
        c.call(proxy);
        world_.scheduler.runUntilIdle();
        ASSERT_EQ(received_.size(), 1u) << c.entryLine;
        EXPECT_EQ(received_[0].first, c.message) << c.entryLine;
        EXPECT_EQ(Value(received_[0].second), Value(c.arguments)) << c.entryLine;
        EXPECT_EQ(fakes_.logSink.logged(), std::vector<std::string>{c.entryLine});
    }
}

TEST_F(LCClientProxyTest, AStopMayCarryAMovieAndNoError) {
    LCClientProxy proxy(fakes_.log, std::nullopt, daemonEnd_);
    proxy.stopRecordingWithError(std::nullopt, URL::file("/tmp/Player.mp4"));
    world_.scheduler.runUntilIdle();
    ASSERT_EQ(received_.size(), 1u);
    EXPECT_TRUE(received_[0].second[0].isNull());
    EXPECT_EQ(received_[0].second[1], Value(URL("file:///tmp/Player.mp4")));
}

TEST_F(LCClientProxyTest, AFrameKeepsItsPicture) {
    LCClientProxy proxy(fakes_.log, std::nullopt, daemonEnd_);
    const auto plane = std::make_shared<FakePlane>(4, 2, 42, std::vector<PixelRect>{});
    proxy.captureHandlerWithSample(plane, kTiming);
    world_.scheduler.runUntilIdle();
    ASSERT_EQ(received_.size(), 1u);
    const auto* lent = received_[0].second[0].as<Value::PlaneRef>();
    ASSERT_TRUE(lent && *lent);
    EXPECT_EQ((*lent)->width(), 4);
    ASSERT_EQ((*lent)->pixels().size(), plane->pixels().size());
    EXPECT_EQ(std::memcmp((*lent)->pixels().data(), plane->pixels().data(), plane->pixels().size()), 0);
    received_.clear();
}

TEST_F(LCClientProxyTest, AfterTheClientExitsEachMessageLogsItsEntryLineAndItsErrorLine) {
    LCClientProxy proxy(fakes_.log, BundleIdentifier("org.example.Player"), daemonEnd_);
    client_->kill();
    world_.scheduler.runUntilIdle();
    for (const Case& c : cases()) {
        fakes_.logSink.clear();
        c.call(proxy);
        world_.scheduler.runUntilIdle();
        EXPECT_EQ(fakes_.logSink.logged(), (std::vector<std::string>{c.entryLine, c.errorLine}));
    }
    EXPECT_TRUE(received_.empty());
}

TEST_F(LCClientProxyTest, WithoutAConnectionOnlyTheEntryLineIsLogged) {
    LCClientProxy nobody(fakes_.log);
    EXPECT_FALSE(nobody.bundleIdentifier());
    EXPECT_FALSE(nobody.connection());
    LCClientProxy cleared(fakes_.log, BundleIdentifier("org.example.Player"), daemonEnd_);
    cleared.setConnection(nullptr);
    for (LCClientProxy* proxy : {&nobody, &cleared})
        for (const Case& c : cases()) {
            fakes_.logSink.clear();
            c.call(*proxy);
            world_.scheduler.runUntilIdle();
            EXPECT_EQ(fakes_.logSink.logged(), std::vector<std::string>{c.entryLine});
        }
    EXPECT_TRUE(received_.empty());
}

TEST_F(LCClientProxyTest, TheConnectionIsNotOwned) {
    LCClientProxy proxy(fakes_.log, std::nullopt, daemonEnd_);
    const std::weak_ptr<IpcConnection> weak = daemonEnd_;
    daemonEnd_->invalidate();
    daemonEnd_.reset();
    world_.scheduler.runUntilIdle();
    EXPECT_TRUE(weak.expired());
    EXPECT_FALSE(proxy.connection());
}

}  // namespace
}  // namespace lumacast
