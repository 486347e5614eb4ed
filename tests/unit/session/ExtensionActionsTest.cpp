// What a session does with a broadcast extension set: its pace, its names, and what the extension is told.

#include "tests/fakes/StubExtension.h"
#include "tests/unit/session/NotedLink.h"
#include "tests/unit/session/SessionWorld.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;

class ExtensionActions : public SessionWorld {
protected:
    ExtensionActions() { fakes_.log.setVerbose(false); }
    /// What waits for an answer holds the session, which holds the link.
    ~ExtensionActions() override { link_->pending.clear(); }

    void sendSamples(std::int64_t mode = 1) {
        session_->setBroadcastExtension(std::make_shared<StubExtension>(BundleIdentifier("org.example.Uploader.upload")));
        session_->setBroadcastUploadExtensionProxy(link_);
        session_->setBroadcastUserInfo(Dictionary{{"title", "Game night"}});
        session_->setBroadcastProcessMode(mode);
    }
    static Dictionary payload(std::int64_t action) {
        return {{"LCBroadcastProcessExtensionPayloadKeyActionType", action},
                {"LCBroadcastExtensionKeyExtensionUserInfo", Dictionary{{"title", "Game night"}}}};
    }
    std::vector<std::int64_t> actions() const {
        std::vector<std::int64_t> all;
        for (const Dictionary& sent : link_->payloads)
            all.push_back(*sent.find("LCBroadcastProcessExtensionPayloadKeyActionType")->as<std::int64_t>());
        return all;
    }
    using Actions = std::vector<std::int64_t>;

    const std::shared_ptr<NotedLink> link_ = std::make_shared<NotedLink>(services_);
};

TEST_F(ExtensionActions, TheIdentifierIsTheExtensionsOwn) {
    EXPECT_FALSE(session_->broadcastExtensionID());
    session_->setBroadcastExtension(std::make_shared<StubExtension>(BundleIdentifier("org.example.Uploader.upload")));
    EXPECT_EQ(session_->broadcastExtensionID(), BundleIdentifier("org.example.Uploader.upload"));
}

TEST_F(ExtensionActions, OutsideOfSampleModeTheCompletionRunsAtOnceAndNobodyIsTold) {
    for (const std::int64_t mode : {0, 2}) {
        sendSamples(mode);
        int completions = 0;
        session_->_notifyExtensionOfAction(ExtensionAction::Start, [&] { ++completions; });
        EXPECT_EQ(completions, 1);
    }
    EXPECT_TRUE(link_->payloads.empty());
    EXPECT_TRUE(fakes_.logSink.logged().empty());
}

TEST_F(ExtensionActions, WithoutAnExtensionTheCompletionRunsAtOnce) {
    sendSamples();
    session_->setBroadcastExtension(nullptr);
    int completions = 0;
    session_->_notifyExtensionOfAction(ExtensionAction::Start, [&] { ++completions; });
    EXPECT_EQ(completions, 1);
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"no broadcast extension found!"});
}

TEST_F(ExtensionActions, WithoutALinkTheCompletionRunsAtOnce) {
    sendSamples();
    session_->setBroadcastUploadExtensionProxy(nullptr);
    int completions = 0;
    session_->_notifyExtensionOfAction(ExtensionAction::Start, [&] { ++completions; });
    EXPECT_EQ(completions, 1);
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"broadcast extension not ready"});
}

TEST_F(ExtensionActions, AStartTellsTheExtensionAndCapturesWhenItHasTakenNoteWithoutAMovie) {
    sendSamples();
    link_->answers = false;
    start();
    ASSERT_EQ(link_->payloads.size(), 1u);
    EXPECT_EQ(link_->payloads[0], payload(1));
    EXPECT_EQ(startAnswers_, 0);
    EXPECT_FALSE(source());
    EXPECT_FALSE(session_->movieWriter());
    EXPECT_TRUE(fakes_.fileSystem.files().empty());
    fakes_.displayCapture.setPlanes(0);  // no frames: only what is told counts here
    link_->pending.at(0)();
    settle();
    EXPECT_EQ(startAnswers_, 1);
    ASSERT_TRUE(source());
    EXPECT_TRUE(source()->isRunning());
    EXPECT_EQ(compare(source()->minimumInterval(), MediaTime::make(1, 30)), 0);
    EXPECT_EQ(source()->minimumInterval().timescale, 30);
    EXPECT_EQ(session_->reportingAgent()->metrics().videoCaptureRate, 30);
}

TEST_F(ExtensionActions, APauseAndAResumeTellTheExtensionOnceEach) {
    sendSamples();
    fakes_.displayCapture.setPlanes(0);
    start();
    bool ran = true;
    link_->whenTold = [&] { ran = source()->isRunning(); };
    pause();
    EXPECT_FALSE(ran) << "the extension is told when capture has stopped";
    pause();
    EXPECT_EQ(actions(), (Actions{1, 2}));
    resume();
    resume();
    EXPECT_EQ(actions(), (Actions{1, 2, 3}));
    EXPECT_TRUE(source()->isRunning());
}

TEST_F(ExtensionActions, WithoutAnExtensionAPauseLogsNothingOfOne) {
    session_->setBroadcastProcessMode(1);
    fakes_.displayCapture.setPlanes(0);
    start();
    fakes_.logSink.clear();
    pause();
    resume();
    EXPECT_EQ(logged("no broadcast extension found!"), 0u);
}

TEST_F(ExtensionActions, AFinishIsAnsweredByTheExtensionAndThenTheLinkIsClosed) {
    sendSamples();
    fakes_.displayCapture.setPlanes(0);
    start();
    link_->answers = false;
    std::vector<std::string> order;
    onRequestLane([&] {
        session_->finishSessionWithHandler([&](std::optional<URL> url, std::optional<Error> error) {
            EXPECT_FALSE(url);
            EXPECT_FALSE(error);
            order.push_back(link_->invalidations == 0 ? "answered, still linked" : "answered too late");
        });
    });
    settle();
    EXPECT_TRUE(order.empty());
    EXPECT_FALSE(session_->isRecording());
    EXPECT_EQ(actions(), (Actions{1, 4}));
    link_->pending.at(0)();
    EXPECT_EQ(order, Lines{"answered, still linked"});
    EXPECT_EQ(link_->invalidations, 1);
    EXPECT_FALSE(session_->broadcastUploadExtensionProxy());
}

TEST_F(ExtensionActions, AFinishThatTheExtensionNeverTakesIsNeverAnsweredAndHoldsNoSession) {
    sendSamples();
    fakes_.displayCapture.setPlanes(0);
    start();
    link_->answers = false;
    EXPECT_EQ(finish().count, 0);
    const std::weak_ptr<LCRecordingSession> session = session_;
    session_.reset();
    settle();
    EXPECT_TRUE(session.expired());
    link_->pending.at(0)();  // the link has outlived its session
    EXPECT_EQ(link_->invalidations, 1);
}

TEST_F(ExtensionActions, InAnUnknownModeTheFirstFrameStopsTheRecordingAndAFinishIsNeverAnswered) {
    sendSamples(7);
    start();
    EXPECT_EQ(startAnswers_, 1);
    EXPECT_EQ(delegate_->stops, std::vector<std::int64_t>{-5812});
    EXPECT_EQ(logged("LCRecordingSession: failed to start writer when appending video sample"), 1u);
    fakes_.displayCapture.setPlanes(0);
    start();
    session_->setMovieWriter(
        std::make_shared<LCMovieWriter>(fakes_.platform(), tempStore_, Size{640, 360}, session_->outputPath()));
    EXPECT_EQ(finish().count, 0);
    EXPECT_EQ(logged("LCRecordingSession: finishWritingWithHandler"), 0u);
    EXPECT_TRUE(link_->payloads.empty());
}

TEST_F(ExtensionActions, AWriterOfAnEarlierRecordingIsNotGivenTheFramesOfAnUnknownMode) {
    start();
    finish();
    ASSERT_TRUE(session_->movieWriter());
    session_->setBroadcastProcessMode(7);
    start();
    EXPECT_FALSE(session_->movieWriter());
    EXPECT_EQ(delegate_->stops, std::vector<std::int64_t>{-5812});
}

TEST_F(ExtensionActions, AClipIsNamedAfterTheApplicationTheTimeAndItsNumber) {
    session_->setBroadcastExtension(std::make_shared<StubExtension>(BundleIdentifier("org.example.Uploader.upload")));
    session_->setSystemRecording(true);  // the extension decides first
    session_->setBroadcastFragmentIndex(3);
    // 2026-01-15 12:00:00 UTC
    EXPECT_EQ(session_->outputPath(),
              "/private/var/mobile/Library/Lumacast//LCMovie_org.example.Player_1768478400.000000_3.mp4");
    advance(milliseconds(1500));
    EXPECT_EQ(session_->outputPath(),
              "/private/var/mobile/Library/Lumacast//LCMovie_org.example.Player_1768478401.500000_3.mp4");
}

TEST_F(ExtensionActions, DisablingForgetsTheExtensionButLeavesItsLink) {
    sendSamples();
    session_->setBroadcastConfiguration(LCBroadcastConfiguration{2.0, {}});
    session_->disableBroadcast();
    EXPECT_FALSE(session_->broadcastExtension());
    EXPECT_FALSE(session_->broadcastUserInfo());
    EXPECT_FALSE(session_->broadcastConfiguration());
    EXPECT_EQ(session_->broadcastProcessMode(), 0);
    EXPECT_EQ(session_->broadcastUploadExtensionProxy(), link_);
    EXPECT_EQ(fakes_.logSink.logged(), Lines{"LCRecordingSession: disableBroadcast"});
}

}  // namespace
}  // namespace lumacast
