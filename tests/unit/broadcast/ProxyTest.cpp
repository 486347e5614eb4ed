// The daemon's end of the link to an upload extension: handshake, payloads, what is reported, the end.

#include "broadcast/LCBroadcastExtensionProxy.h"

#include <gtest/gtest.h>

#include "base/Limits.h"
#include "broadcast/LCExtensionHostContext.h"
#include "broadcast/PayloadKeys.h"
#include "support/Localization.h"
#include "tests/fakes/FakePlane.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/FakeUploader.h"

namespace lumacast {
namespace {

class Proxy : public ::testing::Test {
protected:
    Proxy() {
        fakes_.appExtensions.setContextClass(LCExtensionHostContext::contextClass(fakes_.log));
        fakes_.appExtensions.install(uploadExtension(plan_, true));
        fakes_.appExtensions.extensionsWithMatchingPoint(
            "com.orvane.broadcast-services-upload",
            [this](const auto& found, const auto&) { extension_ = std::static_pointer_cast<FakeAppExtension>(found.at(0)); });
        settle();
        proxy_ = LCBroadcastExtensionProxy::initWithBroadcastUploadExtension(fakes_.platform(), errors_, extension_);
        listenTo(*proxy_);
        fakes_.logSink.clear();
    }
    ~Proxy() override { world_.scheduler.endWorld(); }

    void listenTo(LCBroadcastExtensionProxy& proxy) {
        proxy.setServiceInfoHandler([this](const Value& info) { infos_.push_back(info); });
        proxy.setBroadcastURLHandler([this](const URL& url) { urls_.push_back(url.text()); });
        proxy.setErrorHandler([this](const Error& error) { reported_.push_back(error); });
    }
    void settle() { world_.scheduler.runUntilIdle(); }
    void advance(std::chrono::nanoseconds duration) { world_.scheduler.advance(duration); }
    void establish() {
        proxy_->establishConnectionWithHandler([this](const std::optional<Error>& error) { readies_.push_back(error); });
        settle();
    }
    void send(Dictionary payload) {
        proxy_->processPayload(std::move(payload), [this] { ++completions_; });
        settle();
    }
    static Dictionary frame() {
        return {{std::string(kPayloadSharedPlane),
                 Value(Value::PlaneRef(std::make_shared<FakePlane>(4, 4, 1, std::vector<PixelRect>{})))}};
    }
    std::vector<std::int64_t> codes() const {
        std::vector<std::int64_t> all;
        for (const Error& error : reported_) all.push_back(error.code());
        return all;
    }
    using Codes = std::vector<std::int64_t>;
    using Lines = std::vector<std::string>;
    std::size_t logged(std::string_view text) { return fakes_.logSink.count(text); }

    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    Localization localization_{fakes_.bundles};
    RecordingErrors errors_{localization_};
    const std::shared_ptr<UploaderPlan> plan_ = std::make_shared<UploaderPlan>();
    std::shared_ptr<FakeAppExtension> extension_;
    std::shared_ptr<LCBroadcastExtensionProxy> proxy_;
    std::vector<std::optional<Error>> readies_;
    std::vector<Value> infos_;
    std::vector<std::string> urls_;
    std::vector<Error> reported_;
    int completions_ = 0;
};

TEST_F(Proxy, IsReadyAtTheFirstPing) {
    plan_->pings = 0;
    establish();
    EXPECT_TRUE(readies_.empty());
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"establishing connection to extension", "Connected to extension.",
                     "beginExtensionRequestWithInputItems returned", "Remote endpoint set."}));
    ASSERT_EQ(extension_->begun().size(), 1u);
    ASSERT_EQ(extension_->begun()[0].items.size(), 1u);  // one, and empty
    EXPECT_TRUE(extension_->begun()[0].items[0].attributedTitle.empty());
    EXPECT_TRUE(extension_->begun()[0].items[0].attachments.empty());
    plan_->tell(BroadcastDaemonMessage::Ping);
    settle();
    ASSERT_EQ(readies_.size(), 1u);
    EXPECT_FALSE(readies_[0]);
    EXPECT_EQ(logged("received ping from extension, notifying handler that connection is ready"), 1u);
}

TEST_F(Proxy, EveryPingCallsTheHandler) {
    plan_->pings = 2;
    establish();
    EXPECT_EQ(readies_.size(), 2u);
    EXPECT_TRUE(proxy_->connectionReadyHandler());
}

TEST_F(Proxy, AnExtensionThatCannotBeLaunchedGivesItsError) {
    fakes_.faults.failNext("AppExtension.begin");
    establish();
    ASSERT_EQ(readies_.size(), 1u);
    ASSERT_TRUE(readies_[0]);
    EXPECT_EQ(readies_[0]->code(), 2);
    EXPECT_EQ(logged("Error beginning extension request: 2"), 1u);
}

TEST_F(Proxy, WithoutAVendorTheHandlerIsToldNoErrorAndAPingMayStillCome) {
    fakes_.faults.failNext("AppExtension.vendor");
    establish();
    ASSERT_EQ(readies_.size(), 1u);
    EXPECT_FALSE(readies_[0]);
    EXPECT_EQ(logged("Error setting listenerEndpoint"), 1u);
    EXPECT_EQ(logged("Remote endpoint set."), 0u);
}

TEST_F(Proxy, AnEndpointThatIsNeverTakenHoldsUpItsExtensionsLaneAlone) {
    plan_->answersEndpoint = false;
    establish();
    EXPECT_EQ(readies_.size(), 1u);  // the ping came all the same
    advance(std::chrono::hours(1));
    EXPECT_EQ(logged("Remote endpoint set."), 0u);
    EXPECT_TRUE(reported_.empty());
    // What else it is asked waits behind that.
    extension_->beginExtensionRequestWithInputItems({}, [this](auto, const auto&) { ++completions_; });
    settle();
    EXPECT_EQ(completions_, 0);
}

TEST_F(Proxy, AnExtensionThatGoesBeforeItTookTheEndpointIsReportedAndReleasesTheLane) {
    plan_->answersEndpoint = plan_->connects = false;
    establish();
    extension_->crash();
    settle();
    EXPECT_EQ(codes(), Codes{-5808});
    // The lane is free: another request gets through.
    extension_->beginExtensionRequestWithInputItems({}, [this](auto, const auto&) { ++completions_; });
    settle();
    EXPECT_EQ(completions_, 1);
}

TEST_F(Proxy, OneThatIsMadeFromAnEndpointMakesNoRequestAndAwaitsNoPing) {
    const ListeningUploader uploader(fakes_, plan_, ProcessID{700});
    proxy_ = LCBroadcastExtensionProxy::initWithBroadcastUploadListenerEndpoint(fakes_.platform(), errors_,
                                                                                uploader.endpoint());
    listenTo(*proxy_);
    settle();
    EXPECT_FALSE(proxy_->broadcastUploadExtension());
    EXPECT_FALSE(proxy_->listener());
    send({{"a", 1}});
    EXPECT_EQ(plan_->payloads.size(), 1u);
    EXPECT_EQ(completions_, 1);
    EXPECT_TRUE(extension_->begun().empty());
    // There is nobody to kill, and the end is still an end.
    proxy_->invalidateConnection();
    settle();
    EXPECT_FALSE(proxy_->connection());
    EXPECT_TRUE(reported_.empty());
}

TEST_F(Proxy, TellsWhatTheExtensionReports) {
    establish();
    plan_->tell(BroadcastDaemonMessage::UpdateServiceInfo, {Dictionary{{"viewers", 3}}});
    plan_->tell(BroadcastDaemonMessage::UpdateBroadcastURL, {URL("https://example.org/live")});
    plan_->tell(BroadcastDaemonMessage::FinishBroadcastWithError, {Value(Error("org.example", 7))});
    settle();
    EXPECT_EQ(infos_, std::vector<Value>{Dictionary({{"viewers", 3}})});
    EXPECT_EQ(urls_, std::vector<std::string>{"https://example.org/live"});
    ASSERT_EQ(reported_.size(), 1u);
    EXPECT_EQ(reported_[0], Error("org.example", 7));  // unchanged
    EXPECT_EQ(logged("received serviceInfo"), 1u);
    EXPECT_EQ(logged("received broadcastURL"), 1u);
    EXPECT_EQ(logged("received finish request from service due to error"), 1u);
}

TEST_F(Proxy, ItsEndIsReportedOnce) {
    establish();
    extension_->crash();
    settle();
    ASSERT_EQ(codes(), Codes{-5808});
    EXPECT_EQ(reported_[0].domain(), "com.orvane.Lumacast.LCRecordingErrorDomain");
    EXPECT_EQ(logged("connection to broadcast extension invalidated"), 1u);
}

TEST_F(Proxy, APayloadThatCannotBeSentIsReportedAndNeverCompleted) {
    establish();
    fakes_.faults.failNext("Ipc.send");
    send({{"a", 1}});
    EXPECT_EQ(codes(), Codes{-5808});
    EXPECT_EQ(completions_, 0);
    EXPECT_EQ(logged("error getting remote proxy to extension: 32") + logged("error getting remote proxy to extension: 105"),
              1u);
}

TEST_F(Proxy, CompletionsComeWhenThePayloadWasProcessed) {
    plan_->completesPayloads = false;
    establish();
    send({{"a", 1}});
    EXPECT_EQ(completions_, 0);
    ASSERT_EQ(plan_->uncompleted.size(), 1u);
    plan_->uncompleted[0]();
    settle();
    EXPECT_EQ(completions_, 1);
}

TEST_F(Proxy, AnExtensionThatIsBehindGetsNoFurtherFrameUntilItHasProcessedOne) {
    plan_->completesPayloads = false;
    establish();
    const auto most = limitOf(Limit::FramesAtExtension);
    for (std::uint64_t i = 0; i < most + 2; ++i) send(frame());
    EXPECT_EQ(plan_->payloads.size(), most);
    EXPECT_EQ(proxy_->framesLeftOut(), 2u);
    send({{"sound", 1}});  // only frames are left out
    EXPECT_EQ(plan_->payloads.size(), most + 1);
    plan_->uncompleted.front()();
    settle();
    send(frame());
    EXPECT_EQ(plan_->payloads.size(), most + 2);
    EXPECT_TRUE(reported_.empty());
}

TEST_F(Proxy, AnExtensionThatProcessesNothingForTenSecondsCountsAsLost) {
    plan_->completesPayloads = false;
    establish();
    advance(std::chrono::minutes(5));  // with nothing to do it may be quiet
    EXPECT_TRUE(reported_.empty());
    send({{"a", 1}});
    send({{"a", 2}});
    advance(std::chrono::seconds(8));
    plan_->uncompleted.front()();  // slow, but alive
    advance(std::chrono::seconds(9));
    EXPECT_TRUE(reported_.empty());
    advance(std::chrono::seconds(4));
    EXPECT_EQ(codes(), Codes{-5808});
    advance(std::chrono::minutes(1));
    EXPECT_EQ(codes(), Codes{-5808});  // once
}

TEST_F(Proxy, ADeliberateEndIsReportedToNobodyAndKillsTheExtension) {
    establish();
    fakes_.logSink.clear();
    const auto endpoint = proxy_->listenerEndpoint();
    const auto listener = proxy_->listener();
    proxy_->invalidateConnection();
    settle();
    // Nobody can come that way any more, whoever still has the listener.
    const auto stranger = fakes_.makeProcess(ProcessID{701});
    const auto late = stranger->connectToEndpoint(endpoint);
    int refused = 0;
    late->setInvalidationHandler([&] { ++refused; });
    late->resume();
    settle();
    EXPECT_EQ(refused, 1);
    EXPECT_TRUE(reported_.empty());
    EXPECT_EQ(extension_->signals(), std::vector<int>{9});
    EXPECT_FALSE(extension_->isRunning());
    EXPECT_FALSE(proxy_->connection());
    EXPECT_FALSE(proxy_->listener());
    EXPECT_FALSE(proxy_->broadcastUploadExtension());
    EXPECT_FALSE(proxy_->connectionReadyHandler());
    EXPECT_TRUE(proxy_->listenerEndpoint());  // stays
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"invalidating connection with extension"});
    proxy_->invalidateConnection();
    send({{"a", 1}});
    EXPECT_EQ(completions_, 0);
}

TEST_F(Proxy, AnExtensionThatIsLaunchedAfterTheEndIsKilledToo) {
    proxy_->establishConnectionWithHandler([](const auto&) {});
    proxy_->invalidateConnection();
    EXPECT_TRUE(extension_->signals().empty());
    settle();
    EXPECT_EQ(extension_->signals(), std::vector<int>{9});
    EXPECT_FALSE(extension_->isRunning());
}

TEST_F(Proxy, OneWhoseExtensionNeverTakesTheEndpointCanBeLetGoOf) {
    plan_->answersEndpoint = plan_->connects = false;
    establish();
    std::weak_ptr<LCBroadcastExtensionProxy> weak = proxy_;
    proxy_.reset();
    EXPECT_TRUE(weak.expired());
    settle();
    EXPECT_FALSE(extension_->isRunning());
    EXPECT_TRUE(reported_.empty());
}

TEST_F(Proxy, DestroyingItClosesTheLinkQuietly) {
    establish();
    fakes_.logSink.clear();
    std::weak_ptr<LCBroadcastExtensionProxy> weak = proxy_;
    proxy_.reset();
    EXPECT_TRUE(weak.expired());  // its connection does not keep it
    settle();
    EXPECT_TRUE(reported_.empty());
    EXPECT_EQ(extension_->signals(), std::vector<int>{9});
    EXPECT_EQ(fakes_.logSink.logged(), Lines{});
}

TEST_F(Proxy, ASecondConnectionTakesTheFirstOnesPlaceAndTheFirstsEndIsStillReported) {
    establish();
    const auto first = proxy_->connection();
    const auto other = fakes_.makeProcess(ProcessID{701});
    const auto uploader = std::make_shared<FakeUploader>(plan_);
    uploader->connect(*other, proxy_->listenerEndpoint());
    settle();
    EXPECT_NE(proxy_->connection(), first);
    EXPECT_TRUE(reported_.empty());
    extension_->crash();
    settle();
    EXPECT_EQ(codes(), Codes{-5808});
    send({{"a", 1}});
    EXPECT_EQ(completions_, 1);
}

}  // namespace
}  // namespace lumacast
