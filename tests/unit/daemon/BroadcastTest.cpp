// Broadcasts as a client sees them: setting one up, starting it, its clips and samples, and what goes wrong.

#include "tests/unit/daemon/BroadcastWorld.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

class Broadcast : public BroadcastWorld {};

TEST_F(Broadcast, IsSetUpForItsHostWithWhatTheClientGave) {
    install(true);
    fakes_.bundles.setIcon(BundleIdentifier("org.example.Player"), IconFormat::Large, Data{7});
    const auto client = makeConnected();
    const auto done = setUp(*client, "org.example.Uploader.setup", configuration(2.5));
    ASSERT_EQ(done->answers, 1);
    EXPECT_TRUE(done->values.at(0).isNull());
    EXPECT_EQ(logged("looking for upload extension"), 1u);
    const auto images = client->ask(DaemonMessage::GetCurrentBroadcastImages);
    settle();
    EXPECT_EQ(images->values.at(0), Value(Data{7}));
    EXPECT_EQ(images->values.at(1), Value(Data{0x89, 'P', 'N', 'G', 1}));  // its first icon
    EXPECT_EQ(process_->manager().currentExtensionDisplayName(), "Uploader");
    const auto start = startBroadcast(*client);
    EXPECT_EQ(start->code(), 0);
    EXPECT_EQ(logged("found broadcast info, enabling for session"), 1u);
    const auto kept = session(*client);
    EXPECT_TRUE(kept->isBroadcasting());
    EXPECT_EQ(kept->broadcastProcessMode(), 1);
    EXPECT_EQ(kept->broadcastExtensionID(), BundleIdentifier("org.example.Uploader.upload"));
    EXPECT_EQ(kept->broadcastConfiguration()->clipDuration, 2.5);
    ASSERT_FALSE(plan_->payloads.empty());
    EXPECT_EQ(plan_->payloads[0].entries().size(), 2u);
    EXPECT_EQ(*plan_->payloads[0].find("LCBroadcastExtensionKeyExtensionUserInfo"),
              Value(Dictionary{{"title", "Game night"}}));
}

TEST_F(Broadcast, AnUndecodableConfigurationOrNoUserInfoDoesNotFailTheSetUp) {
    install(true);
    const auto client = makeConnected();
    EXPECT_TRUE(setUp(*client, "org.example.Uploader.x", Data{1, 2, 3}, Value())->values.at(0).isNull());
    EXPECT_EQ(startBroadcast(*client)->code(), 0);
    EXPECT_FALSE(session(*client)->broadcastConfiguration());
    EXPECT_EQ(plan_->payloads.at(0).find("LCBroadcastExtensionKeyExtensionUserInfo"), nullptr);
}

TEST_F(Broadcast, OfTwoWithOneBaseTheFirstIsTaken) {
    install(true, "org.example.Uploader.upload");
    install(true, "org.example.UploaderOfAnother.upload");  // a plain prefix: that is one, too
    const auto client = makeConnected();
    EXPECT_TRUE(setUp(*client)->values.at(0).isNull());
    EXPECT_EQ(startBroadcast(*client)->code(), 0);
    EXPECT_EQ(session(*client)->broadcastExtensionID(), BundleIdentifier("org.example.Uploader.upload"));
}

TEST_F(Broadcast, TheImagesAreTheLastSetUpsWhoeverAsks) {
    install(true);
    fakes_.bundles.setIcon(BundleIdentifier("org.example.Player"), IconFormat::Large, Data{7});
    const auto client = makeConnected();
    setUp(*client);
    const auto other = makeConnected("Editor", 600, 9);
    const auto images = other->ask(DaemonMessage::GetCurrentBroadcastImages);
    settle();
    EXPECT_EQ(images->values.at(0), Value(Data{7}));
}

TEST_F(Broadcast, WithoutAnExtensionNothingIsSetUp) {
    const auto client = makeConnected();
    const auto none = setUp(*client);
    ASSERT_TRUE(none->error(0));
    EXPECT_EQ(none->error(0)->code(), -5808);
    fakes_.faults.failNext("AppExtensions.match", 2);
    const auto broken = setUp(*client);
    ASSERT_TRUE(broken->error(0));
    EXPECT_EQ(broken->error(0)->code(), 2);  // the lookup's own
    EXPECT_EQ(startBroadcast(*client)->code(), -5808);
}

TEST_F(Broadcast, AStartWithoutASetUpIsRefusedWithoutDescriptionAndEndsItsTransaction) {
    const auto client = makeConnected();
    const auto start = startBroadcast(*client);
    ASSERT_TRUE(start->error(0));
    EXPECT_EQ(start->error(0)->code(), -5808);
    EXPECT_TRUE(start->error(0)->userInfo().empty());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    EXPECT_EQ(logged("attempted to start broadcast without a session, bailing out"), 1u);
}

TEST_F(Broadcast, ASecondSetUpOfTheSameHostReplacesTheFirst) {
    install(true, "org.example.First.upload");
    install(false, "org.example.Second.upload");
    const auto client = makeConnected();
    setUp(*client, "org.example.First.x");
    setUp(*client, "org.example.Second.x");
    EXPECT_EQ(startBroadcast(*client)->code(), 0);
    EXPECT_EQ(session(*client)->broadcastExtensionID(), BundleIdentifier("org.example.Second.upload"));
}

TEST_F(Broadcast, ASetUpThatFailsLeavesTheOneBeforeAsItWas) {
    install(true);
    const auto client = makeConnected();
    setUp(*client);
    setUp(*client, "org.example.Missing.x");
    EXPECT_EQ(startBroadcast(*client)->code(), 0);
}

TEST_F(Broadcast, TheCallerMayNameAnyHost) {
    install(true);
    const auto player = makeConnected();
    const auto other = makeConnected("Editor", 600, 9);
    setUp(*other, "org.example.Uploader.x", {}, Value(), "org.example.Player");
    EXPECT_EQ(startBroadcast(*player)->code(), 0);
    EXPECT_EQ(startBroadcast(*other)->code(), -5808);
}

TEST_F(Broadcast, TheOlderPointIsSearchedWhenTheFirstHasNoMatch) {
    auto older = uploadExtension(plan_, true, "org.example.Old.upload");
    older.point = "com.orvane.broadcast-services";
    auto streaming = older;
    streaming.identifier = BundleIdentifier("org.example.Old.streams");
    streaming.attributes = {{std::string(kExtensionActivationRule),
                             Dictionary{{"ExtensionActivationSupportsLumacastStreaming", true}}}};
    fakes_.appExtensions.install(streaming);
    fakes_.appExtensions.install(older);
    const auto client = makeConnected();
    EXPECT_TRUE(setUp(*client, "org.example.Old.x")->values.at(0).isNull());
    EXPECT_EQ(fakes_.appExtensions.lookups(),
              (Lines{"com.orvane.broadcast-services-upload", "com.orvane.broadcast-services"}));
    EXPECT_EQ(logged("looking for upload extension"), 1u);
    EXPECT_EQ(startBroadcast(*client)->code(), 0);
    EXPECT_EQ(session(*client)->broadcastExtensionID(), BundleIdentifier("org.example.Old.upload"));
}

TEST_F(Broadcast, AnErrorOfTheFirstLookupLeadsToTheSecondToo) {
    auto older = uploadExtension(plan_, true, "org.example.Old.upload");
    older.point = "com.orvane.broadcast-services";
    fakes_.appExtensions.install(older);
    fakes_.faults.failNext("AppExtensions.match");
    const auto client = makeConnected();
    EXPECT_TRUE(setUp(*client, "org.example.Old.x")->values.at(0).isNull());
}

TEST_F(Broadcast, ASetUpIsUsedOnceAndItsImagesEndWithTheStop) {
    const auto client = makeBroadcasting(true);
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    ASSERT_EQ(stop->answers, 1);
    EXPECT_TRUE(stop->values.at(0).isNull());
    EXPECT_TRUE(stop->values.at(1).isNull());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    const auto images = client->ask(DaemonMessage::GetCurrentBroadcastImages);
    settle();
    EXPECT_TRUE(images->values.at(0).isNull());
    EXPECT_TRUE(images->values.at(1).isNull());
    EXPECT_FALSE(process_->manager().currentExtensionDisplayName());
    EXPECT_EQ(startBroadcast(*client)->code(), -5808);
}

TEST_F(Broadcast, UploadExtensionsAreListedWithTheirNamesAndFirstIcons) {
    install(true, "org.example.A.upload");
    install(false, "org.example.B.upload");
    auto older = uploadExtension(plan_, true, "org.example.Old");
    older.point = "com.orvane.broadcast-services";
    fakes_.appExtensions.install(older);
    const auto client = makeConnected();
    const auto list = client->ask(DaemonMessage::GetSystemBroadcastExtensionInfo);
    settle();
    const auto entry = [](const std::string& id) {
        return Value(Dictionary{
            {"displayName", "Uploader"}, {"extBundleID", id}, {"extAppImgData", Data{0x89, 'P', 'N', 'G', 1}}});
    };
    EXPECT_EQ(list->values.at(0), Value(Array{entry("org.example.A.upload"), entry("org.example.B.upload")}));
    EXPECT_TRUE(list->values.at(1).isNull());
    fakes_.faults.failNext("AppExtensions.match");
    const auto broken = client->ask(DaemonMessage::GetSystemBroadcastExtensionInfo);
    settle();
    EXPECT_EQ(broken->values.at(0), Value(Array{}));
    ASSERT_TRUE(broken->error(1));
}

TEST_F(Broadcast, SamplesGoToTheExtensionFromItsStartToItsFinish) {
    const auto client = makeBroadcasting(true);
    advance(seconds(1));
    fakes_.displayCapture.deliverFrames();
    settle();
    EXPECT_GT(plan_->samples(1), 0u);
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(stop->answers, 1);
    EXPECT_EQ(plan_->actions(), (std::vector<std::int64_t>{1, 4}));
    EXPECT_FALSE(session(*client)->broadcastUploadExtensionProxy());
    EXPECT_EQ(extension()->signals(), std::vector<int>{9});
    EXPECT_TRUE(movies().empty());
}

TEST_F(Broadcast, WhatTheExtensionReportsReachesTheClient) {
    const auto client = makeBroadcasting(true);
    plan_->tell(BroadcastDaemonMessage::UpdateServiceInfo, {Dictionary{{"viewers", 3}}});
    plan_->tell(BroadcastDaemonMessage::UpdateBroadcastURL, {URL("https://example.org/live")});
    settle();
    EXPECT_EQ(toldOf(*client, ClientMessage::UpdateBroadcastServiceInfo), 1);
    EXPECT_EQ(toldOf(*client, ClientMessage::UpdateBroadcastURL), 1);
}

TEST_F(Broadcast, AnExtensionThatCannotBeLaunchedMakesAPlainMovieOfIt) {
    install(true);
    const auto client = makeConnected();
    setUp(*client);
    fakes_.faults.failNext("AppExtension.begin");
    const auto start = startBroadcast(*client);
    EXPECT_EQ(start->code(), 0);
    EXPECT_EQ(logged("LCRecordingSession: disableBroadcast"), 1u);
    EXPECT_TRUE(session(*client)->isBroadcasting());  // deliberately as asked for
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_TRUE(stop->url(0));
}

TEST_F(Broadcast, AnExtensionThatDiesStopsTheBroadcastAndTheNextOneWorks) {
    const auto client = makeBroadcasting(true);
    extension()->crash();
    settle();
    EXPECT_EQ(client->toldOfStop(-5808), 1);
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    setUp(*client);
    EXPECT_EQ(startBroadcast(*client)->code(), 0);
    EXPECT_EQ(plan_->launches, 2);
}

TEST_F(Broadcast, ItsOwnFailureReachesTheClientUnchanged) {
    const auto client = makeBroadcasting(true);
    plan_->tell(BroadcastDaemonMessage::FinishBroadcastWithError, {Value(Error("org.example.upload", 77))});
    settle();
    EXPECT_EQ(client->toldOfStop(77), 1);
    EXPECT_EQ(extension()->signals(), std::vector<int>{9});
}

TEST_F(Broadcast, AClientThatGoesFinishesItsBroadcast) {
    auto client = makeBroadcasting(true);
    client->die();
    settle();
    EXPECT_EQ(plan_->actions(), (std::vector<std::int64_t>{1, 4}));
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(Broadcast, APauseIsToldAndTheResumeOfABroadcastDoesNothing) {
    const auto client = makeBroadcasting(true);
    client->tell(DaemonMessage::PauseRecording);
    settle();
    client->tell(DaemonMessage::ResumeRecording, {number(client->window)});
    settle();
    EXPECT_EQ(plan_->actions(), (std::vector<std::int64_t>{1, 2}));
    EXPECT_TRUE(session(*client)->isPaused());
}

TEST_F(Broadcast, AnotherApplicationsStartEndsItAndItsClientIsTold) {
    const auto client = makeBroadcasting(true);
    const auto other = makeRecording("Editor", 600, 9);
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_EQ(plan_->actions(), (std::vector<std::int64_t>{1, 4}));
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
}

TEST_F(Broadcast, TheLastClipIsHandedOverWithTheFinishedFlagAndGoneAfterwards) {
    const auto client = makeBroadcasting(false);
    advance(seconds(1));
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    ASSERT_EQ(stop->answers, 1);
    EXPECT_TRUE(stop->values.at(0).isNull());  // it is the extension's
    EXPECT_TRUE(stop->values.at(1).isNull());
    ASSERT_EQ(plan_->requests.size(), 1u);
    const auto& items = plan_->requests[0];
    ASSERT_EQ(items.size(), 4u);
    EXPECT_EQ(items[0].attributedTitle, "LCBroadcastExtensionKeyRequestedFinish");
    EXPECT_EQ(items[0].attachments.at(0).item, Value("1"));
    EXPECT_EQ(items[1].attributedTitle, "LCBroadcastExtensionKeyExtensionSandboxToken");
    EXPECT_EQ(items[1].attachments.at(0).item, Value(Data{'t', 'o', 'k', 'e', 'n', ' ', '1'}));
    EXPECT_EQ(items[2].attributedTitle, "LCBroadcastExtensionKeyExtensionUserInfo");
    EXPECT_EQ(items[2].attachments.at(0).item, Value(Dictionary{{"title", "Game night"}}));
    EXPECT_EQ(items[3].attributedTitle, "LCBroadcastExtensionKeyMovieClipURL");
    ASSERT_EQ(extension()->tokens().size(), 1u);
    EXPECT_EQ(extension()->tokens()[0].tokenClass, "com.orvane.lumacastd.read-only");
    EXPECT_EQ(items[3].attachments.at(0).item, Value("file://" + extension()->tokens()[0].path));
    EXPECT_EQ(logged("extension finished, clean up movie clip"), 1u);
    EXPECT_TRUE(movies().empty());
    EXPECT_EQ(logged("begining extension request"), 1u);
    EXPECT_EQ(logged("finished extension request with items with error code: 0)"), 1u);
}

TEST_F(Broadcast, WithoutATokenTheClipStaysWhereItIs) {
    const auto client = makeBroadcasting(false);
    advance(seconds(1));
    fakes_.faults.failNext("AppExtension.token");
    client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(logged("sb token is null!"), 1u);
    EXPECT_TRUE(plan_->requests.empty());
    EXPECT_EQ(movies().size(), 1u);
}

TEST_F(Broadcast, CaptureModeHandsTheClientItsOwnFramesAndSound) {
    const auto client = makeConnected();
    const auto start = client->start({client->window}, {.capture = true});
    settle();
    ASSERT_EQ(start->answers, 1);
    EXPECT_EQ(start->code(), 0);
    advance(milliseconds(200));
    fakes_.displayCapture.deliverFrames();
    settle();
    ASSERT_TRUE(fakes_.audioInputQueues.lastQueue());
    fakes_.audioInputQueues.lastQueue()->deliver(Data(1764, 7), 60'000'000);
    settle();
    const auto first = [&](ClientMessage message) -> const TestClient::Told* {
        for (const auto& told : client->told)
            if (told.message == message) return &told;
        return nullptr;
    };
    const auto* video = first(ClientMessage::CaptureHandlerWithSample);
    ASSERT_TRUE(video);
    EXPECT_TRUE(video->arguments.at(0).as<Value::PlaneRef>());
    EXPECT_EQ(video->arguments.at(1).as<Data>()->size(), 72u);
    const auto* audio = first(ClientMessage::CaptureHandlerWithAudioSample);
    ASSERT_TRUE(audio);
    EXPECT_EQ(audio->arguments.at(0), Value(Data(1764, 7)));
    EXPECT_EQ(audio->arguments.at(1).as<Data>()->size(), 40u);
    EXPECT_EQ(audio->arguments.at(2), Value(std::int64_t{882}));
    EXPECT_EQ(audio->arguments.at(3), Value(std::int64_t{2}));
    EXPECT_EQ(audio->arguments.at(4).as<Data>()->size(), 72u);
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    ASSERT_EQ(stop->answers, 1);
    EXPECT_TRUE(stop->values.at(0).isNull());
    EXPECT_TRUE(stop->values.at(1).isNull());
}

}  // namespace
}  // namespace lumacast
