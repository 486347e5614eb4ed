// Broadcasts that wait for their extension, that begin while another one ends, and whose extension fails between the
// two.

#include "tests/unit/daemon/BroadcastWorld.h"

namespace lumacast {
namespace {

using std::chrono::seconds;

class BroadcastStart : public BroadcastWorld {};

TEST_F(BroadcastStart, AnExtensionThatNeverPingsHoldsUpItsOwnStartAlone) {
    plan_->pings = 0;
    install(true);
    const auto client = makeConnected();
    setUp(*client);
    const auto waiting = startBroadcast(*client);
    advance(seconds(100));
    EXPECT_EQ(waiting->answers, 0);
    // Others are served: they ask, record and stop.
    const auto other = makeRecording("Editor", 600, 9);
    const auto stop = other->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(stop->answers, 1);
    EXPECT_EQ(waiting->answers, 0);
    plan_->tell(BroadcastDaemonMessage::Ping);
    settle();
    ASSERT_EQ(waiting->answers, 1);
    EXPECT_EQ(waiting->code(), 0);
}

TEST_F(BroadcastStart, TheWaitForAPingEndsWithTheClient) {
    plan_->pings = 0;
    install(true);
    auto client = makeConnected();
    setUp(*client);
    startBroadcast(*client);
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
    client->die();
    settle();
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    EXPECT_TRUE(fakes_.appExtensions.extensions().empty() || !extension()->isRunning());
}

TEST_F(BroadcastStart, WhoseClientConnectsAnewOrGoesBeforeTheWaitHasBegunWaitsForNobody) {
    plan_->pings = 0;
    install(true);
    for (const bool goes : {false, true}) {
        const auto client = makeConnected(goes ? "Player" : "Editor", goes ? 500 : 600);
        setUp(*client);
        // The start's turn to connect comes late.
        const auto turn = world_.scheduler.semaphore(0);
        const auto itsSession = session(*client);
        itsSession->startQueue().async([&] { turn->wait(); });
        startBroadcast(*client);
        EXPECT_EQ(fakes_.keepAlive.open(), 1);
        goes ? client->die() : client->connect();
        settle();
        turn->signal();
        settle();
        EXPECT_EQ(fakes_.keepAlive.open(), 0) << goes;
        EXPECT_TRUE(world_.scheduler.blockedTasks().empty()) << goes;
        EXPECT_EQ(plan_->launches, 0) << "an extension is launched for nobody";
        EXPECT_FALSE(itsSession->broadcastUploadExtensionProxy());
    }
    // The next one works.
    plan_->pings = 1;
    const auto next = makeConnected("Viewer", 700, 9);
    setUp(*next);
    EXPECT_EQ(startBroadcast(*next)->code(), 0);
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
}

TEST_F(BroadcastStart, ANewerStartOfTheApplicationEndsTheWaitAndRefusesTheOlderOne) {
    plan_->pings = 0;
    install(true);
    const auto client = makeConnected();
    setUp(*client);
    const auto waiting = startBroadcast(*client);
    const auto newer = client->start();
    settle();
    ASSERT_EQ(waiting->answers, 1);
    EXPECT_EQ(waiting->code(), -5803);
    ASSERT_EQ(newer->answers, 1);
    EXPECT_EQ(newer->code(), 0);
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_FALSE(session(*client)->isBroadcasting());
    EXPECT_FALSE(session(*client)->broadcastUploadExtensionProxy());
    EXPECT_EQ(session(*client)->broadcastProcessMode(), 0);
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
    // The older one's extension has gone, and nothing of it ends the newer recording.
    for (const auto& one : fakes_.appExtensions.extensions()) EXPECT_FALSE(one->isRunning());
    advance(seconds(30));
    EXPECT_TRUE(session(*client)->isRecording());
}

TEST_F(BroadcastStart, AnExtensionThatNeverAnswersTheFinishEndsNothingThatComesAfterIt) {
    const auto client = makeBroadcasting(true);
    plan_->completesPayloads = false;
    const auto uploader = extension();
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(stop->answers, 0);
    const auto start = client->start();
    settle();
    EXPECT_EQ(start->code(), 0);
    advance(seconds(30));  // it is given up meanwhile
    EXPECT_EQ(uploader->signals(), std::vector<int>{9});
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_EQ(client->toldOfStop(-5808), 0);
}

TEST_F(BroadcastStart, AnExtensionThatDiesBeforeItsPingAnswersTheStartWithItsError) {
    plan_->diesBeforePing = true;
    install(true);
    const auto client = makeConnected();
    setUp(*client);
    const auto start = startBroadcast(*client);
    ASSERT_EQ(start->answers, 1);
    EXPECT_EQ(start->code(), -5808);
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_FALSE(session(*client)->broadcastUploadExtensionProxy());
    // The next one works.
    plan_->diesBeforePing = false;
    setUp(*client);
    EXPECT_EQ(startBroadcast(*client)->code(), 0);
}

TEST_F(BroadcastStart, AnExtensionThatDiesBeforeItTookNoteOfTheStartAnswersItWithItsError) {
    plan_->completesPayloads = false;
    install(true);
    const auto client = makeConnected();
    setUp(*client);
    const auto start = startBroadcast(*client);
    EXPECT_EQ(start->answers, 0);
    EXPECT_TRUE(session(*client)->isRecording());
    extension()->crash();
    settle();
    ASSERT_EQ(start->answers, 1);
    EXPECT_EQ(start->code(), -5808);
    EXPECT_EQ(client->toldOfStop(-5808), 1);
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(BroadcastStart, ANewerBroadcastTakesTheOneThatWaitsForItsPlaceWithTheSameSetUpOrAnotherOne) {
    for (const bool setsUpAnew : {false, true}) {
        plan_->pings = 0;
        if (fakes_.appExtensions.lookups().empty()) install(true);
        const auto client = makeConnected(setsUpAnew ? "Player" : "Editor", setsUpAnew ? 500 : 600);
        setUp(*client);
        const auto waiting = startBroadcast(*client);
        EXPECT_EQ(waiting->answers, 0);
        if (setsUpAnew) setUp(*client);
        plan_->pings = 1;
        const auto newer = startBroadcast(*client);
        ASSERT_EQ(waiting->answers, 1);
        EXPECT_EQ(waiting->code(), -5803);
        ASSERT_EQ(newer->answers, 1);
        EXPECT_EQ(newer->code(), 0) << setsUpAnew;
        EXPECT_TRUE(session(*client)->isBroadcasting());
        EXPECT_TRUE(session(*client)->broadcastUploadExtensionProxy());
        EXPECT_EQ(fakes_.keepAlive.open(), 1);
        EXPECT_EQ(client->ask(DaemonMessage::StopRecording)->answers, 0);
        settle();
        EXPECT_EQ(fakes_.keepAlive.open(), 0);
    }
}

TEST_F(BroadcastStart, OneInPlaceOfTheApplicationsOwnLosesTheSetUpAndTheOldOneIsInterrupted) {
    const auto client = makeBroadcasting(true);
    plan_->completesPayloads = false;
    const auto newer = startBroadcast(*client);
    ASSERT_EQ(newer->answers, 1);
    EXPECT_EQ(newer->code(), -5808);
    EXPECT_EQ(client->toldOfStop(-5806), 0);  // not before its extension has taken note
    ASSERT_FALSE(plan_->uncompleted.empty());
    plan_->uncompleted.back()();
    settle();
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(BroadcastStart, OneWhileTheLastOnesFinishIsUnderWayHasItsOwnExtensionAndTheStopIsAnsweredStill) {
    const auto client = makeBroadcasting(true);
    const auto older = session(*client)->broadcastUploadExtensionProxy();
    const auto olderExtension = extension();
    plan_->completesPayloads = false;
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(stop->answers, 0);
    plan_->completesPayloads = true;
    const auto finish = std::exchange(plan_->uncompleted, {});
    setUp(*client);
    const auto start = startBroadcast(*client);
    ASSERT_EQ(start->code(), 0);
    const auto newer = session(*client)->broadcastUploadExtensionProxy();
    ASSERT_TRUE(newer);
    EXPECT_NE(newer, older);
    EXPECT_TRUE(olderExtension->signals().empty()) << "it has not answered yet";
    finish.back()();
    settle();
    EXPECT_EQ(stop->answers, 1);
    EXPECT_EQ(olderExtension->signals(), std::vector<int>{9});
    EXPECT_EQ(session(*client)->broadcastUploadExtensionProxy(), newer);
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
}

TEST_F(BroadcastStart, OneWhoseForerunnerNeverTakesItsFinishGoesOnWhenThatIsGivenUp) {
    const auto client = makeBroadcasting(true);
    const auto olderExtension = extension();
    plan_->completesPayloads = false;
    client->ask(DaemonMessage::StopRecording);
    settle();
    plan_->completesPayloads = true;
    setUp(*client);
    ASSERT_EQ(startBroadcast(*client)->code(), 0);
    advance(seconds(30));
    EXPECT_EQ(olderExtension->signals(), std::vector<int>{9});
    EXPECT_TRUE(session(*client)->isRecording());
    EXPECT_EQ(client->toldOfStop(-5808), 0);
}

TEST_F(BroadcastStart, IsAnsweredThoughItsClientStoppedItBeforeItsExtensionDied) {
    plan_->completesPayloads = false;
    install(true);
    const auto client = makeConnected();
    setUp(*client);
    const auto start = startBroadcast(*client);
    client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(start->answers, 0);
    extension()->crash();
    settle();
    ASSERT_EQ(start->answers, 1);
    EXPECT_EQ(start->code(), -5808);
    // The application goes on as it likes.
    const auto plain = client->start();
    settle();
    EXPECT_EQ(plain->code(), 0);
    EXPECT_EQ(start->answers, 1);
    EXPECT_EQ(fakes_.keepAlive.open(), 1);
}

TEST_F(BroadcastStart, IsAnsweredThoughItsExtensionTookNoteOfTheFinishAlone) {
    plan_->completesPayloads = false;
    install(true);
    const auto client = makeConnected();
    setUp(*client);
    const auto start = startBroadcast(*client);
    ASSERT_EQ(plan_->uncompleted.size(), 1u);
    plan_->completesPayloads = true;
    const auto stop = client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(stop->answers, 1);
    ASSERT_EQ(start->answers, 1);
    EXPECT_EQ(start->code(), -5808);
    EXPECT_EQ(client->toldOfStop(-5808), 0);
    plan_->uncompleted.front()();
    settle();
    EXPECT_EQ(start->answers, 1);
}

TEST_F(BroadcastStart, WhoseExtensionCanNotBeToldOfItIsAnsweredWhenTheApplicationStartsAnew) {
    fakes_.faults.failNext("AppExtension.vendor");
    install(true);
    const auto client = makeConnected();
    setUp(*client);
    const auto start = startBroadcast(*client);
    EXPECT_EQ(start->answers, 0);
    client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(start->answers, 0);
    const auto newer = client->start();
    settle();
    ASSERT_EQ(start->answers, 1);
    EXPECT_EQ(start->code(), -5803);
    ASSERT_EQ(newer->answers, 1);
    EXPECT_EQ(newer->code(), 0);
}

TEST_F(BroadcastStart, WithAnEndpointGoesToTheExtensionThatListensThere) {
    install(true);
    const ListeningUploader uploader(fakes_, plan_, ProcessID{700});
    const auto client = makeConnected();
    setUp(*client);
    const auto start = client->start({client->window}, {.broadcast = true}, uploader.endpoint());
    settle();
    ASSERT_EQ(start->answers, 1);
    EXPECT_EQ(start->code(), 0);
    EXPECT_EQ(plan_->launches, 1) << "the one that listens";
    EXPECT_EQ(plan_->actions(), std::vector<std::int64_t>{1});
    // What it reports, it reports from the first moment on, and its end ends the broadcast.
    plan_->tell(BroadcastDaemonMessage::UpdateServiceInfo, {Dictionary{{"viewers", 3}}});
    plan_->tell(BroadcastDaemonMessage::FinishBroadcastWithError, {Value(Error("org.example.upload", 77))});
    settle();
    EXPECT_EQ(toldOf(*client, ClientMessage::UpdateBroadcastServiceInfo), 1);
    EXPECT_EQ(client->toldOfStop(77), 1);
}

TEST_F(BroadcastStart, WhatAnExtensionReturnsWithAClipReachesTheClient) {
    plan_->returned = {{"LCBroadcastExtensionKeyExtensionServiceInfo",
                        {ItemProvider{std::string(kGenericDataType), Dictionary{{"viewers", 1}}, {}}}}};
    fakes_.displayCapture.setAutomatic(true);
    const auto client = makeBroadcasting(false);
    advance(seconds(1));
    client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(toldOf(*client, ClientMessage::UpdateBroadcastServiceInfo), 1);
    EXPECT_EQ(logged("LCRecordingManager:broadcastSessionDidUpdateServiceInfo:"), 1u);
}

TEST_F(BroadcastStart, AnExtensionThatNeverTakesTheFinishIsKilledThoughItsClientHasGone) {
    auto client = makeBroadcasting(true);
    plan_->completesPayloads = false;
    const auto uploader = extension();
    client->die();
    settle();
    EXPECT_TRUE(uploader->isRunning());
    advance(seconds(30));
    EXPECT_EQ(uploader->signals(), std::vector<int>{9});
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

}  // namespace
}  // namespace lumacast
