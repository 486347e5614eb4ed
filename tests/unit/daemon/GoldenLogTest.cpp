// The logs of a recording's ways, line by line. Written by hand, not copied from a run.

#include <set>

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

class GoldenLog : public DaemonWorld {
protected:
    /// Whether the log is made of these lines of several lanes, each lane's in its order, and of nothing else.
    static ::testing::AssertionResult isMixOf(const Lines& log, const std::vector<Lines>& lanes) {
        // How many lines of each lane the log up to here may have used up.
        std::set<std::vector<std::size_t>> reached{std::vector<std::size_t>(lanes.size(), 0)};
        for (std::size_t n = 0; n < log.size(); ++n) {
            std::set<std::vector<std::size_t>> next;
            for (const auto& used : reached)
                for (std::size_t lane = 0; lane < lanes.size(); ++lane)
                    if (used[lane] < lanes[lane].size() && lanes[lane][used[lane]] == log[n]) {
                        auto more = used;
                        ++more[lane];
                        next.insert(std::move(more));
                    }
            if (next.empty())
                return ::testing::AssertionFailure() << "line " << n + 1 << " does not belong there: " << log[n]
                                                     << "\nof " << ::testing::PrintToString(log);
            reached = std::move(next);
        }
        std::size_t all = 0;
        for (const Lines& lane : lanes) all += lane.size();
        if (log.size() == all) return ::testing::AssertionSuccess();
        return ::testing::AssertionFailure() << "the log ends early: " << ::testing::PrintToString(log);
    }
    /// The lines of a start that goes on, from its request to its answer.
    const Lines start_{
        "LCRecordingManager:startRecordingWindowLayerContextID:windowSize:microphoneEnabled:streaming:withHandler:",
        "LCRecordingManager:stopCurrentRecordingSession:",
        "LCRecordingManager: suppressAlert=1",
        "starting...",
        "broadcast disabled",
        "LCRecordingSession: disableBroadcast",
        "LCRecordingManager:interruptRecordingSessions",
        "LCRecordingSession: startSession",
        "LCMovieWriter: startWritingHandler",
        "LCMovieWriter: setupAssetWriter",
        "bit rate set to 3000000",
        "app window mode",
        "recording session started"};
    /// Those of the audio capture queue meanwhile: the capture begins when the tap runs.
    const Lines tapStarts_{"LCRecordingManager: startAudioCapture: Created Audio Queue Input",
                           "LCRecordingManager: startAudioCapture: Successfully set Audio Queue to PID",
                           "LCRecordingManager: startAudioCapture: Successfully started Audio Queue Recording",
                           "starting capture"};
    /// Those of a recording of one picture that is ended for it.
    static Lines ended(bool tapped = true) {
        return joined(joined({"LCRecordingManager: stopRecordingSession:handler:",
                              "LCRecordingSession: finishSessionWithHandler", "LCRecordingSession: stop"},
                             captureStops(tapped)),
                      {"recordedFileSize for URL 1000 bytes", "LCMovieWriter: finishWritingWithHandler: status = 1",
                       "LCRecordingSession: finishWritingWithHandler"});
    }
};

TEST_F(GoldenLog, AWholeRecordingWithItsPauseLogsTheseLinesInThisOrder) {
    const auto client = makeClient();
    client->connect();
    settle();
    client->start();
    settle();
    advance(std::chrono::milliseconds(500));
    client->tell(DaemonMessage::PauseRecording);
    settle();
    advance(std::chrono::seconds(5));
    client->tell(DaemonMessage::ResumeRecording, {number(client->window)});
    settle();
    advance(std::chrono::milliseconds(500));
    client->ask(DaemonMessage::StopRecording);
    settle();
    Lines expected{
        "_srSetupTempDirectory",
        // The connection.
        "LCRecordingManager: shouldAcceptNewConnection:",
        "accepted client connection PID: 500",
        "LCRecordingManager:recordingSessionForBundleID",
        "no session, creating a new one",
        "LCRecordingManager:removeAcknowledgementExemptionIfOverThreshholdForBundleID:",
        // The start.
        "LCRecordingManager:startRecordingWindowLayerContextID:windowSize:microphoneEnabled:streaming:withHandler:",
        "LCRecordingManager:stopCurrentRecordingSession:",
        "LCRecordingManager: suppressAlert=1",
        "starting...",
        "broadcast disabled",
        "LCRecordingSession: disableBroadcast",
        "LCRecordingManager:interruptRecordingSessions",
        "LCRecordingSession: startSession",
        "LCMovieWriter: startWritingHandler",
        "LCMovieWriter: setupAssetWriter",
        "bit rate set to 3000000",
        "app window mode",
        "recording session started",
        // The pause.
        "LCRecordingManager:pauseRecording",
        "LCRecordingSession: pauseSession",
    };
    const auto add = [&](const Lines& lines) { expected.insert(expected.end(), lines.begin(), lines.end()); };
    add(captureStops());
    add({
        // The resume; the source's repeat of its last picture is dropped.
        "LCRecordingManager: resumeRecording",
        "LCRecordingSession: resumeSessionWithContextID:",
        "app window mode",
        // The stop.
        "LCRecordingManager: stopRecordingWithHandler:",
        "LCRecordingManager: stopRecordingWithStartTimeOffset:endTimeOffset:handler:",
        "LCRecordingManager: stopRecordingSession:handler:",
        "LCRecordingSession: finishSessionWithHandler",
        "LCRecordingSession: stop",
    });
    add(captureStops());
    add({
        // One picture at the start, and one at the resume beside the repeat.
        "recordedFileSize for URL 2000 bytes",
        "LCMovieWriter: finishWritingWithHandler: status = 1",
        "LCRecordingSession: finishWritingWithHandler",
        "LCRecordingManager:resetStatesForSession:",
    });
    EXPECT_TRUE(isMixOf(fakes_.logSink.logged(), {expected, joined(tapStarts_, tapStarts_)}));
    ASSERT_EQ(fakes_.logSink.printed().size(), 1u);
    EXPECT_TRUE(
        fakes_.logSink.printed()[0].starts_with("LCReportingAgent: reportingEvent:1 payload:{\"ActiveDuration\" = 1;"))
        << fakes_.logSink.printed()[0];
}

TEST_F(GoldenLog, ARestartOfTheSameApplication) {
    const auto client = makeRecording();
    client->start();
    settle();
    EXPECT_TRUE(isMixOf(fakes_.logSink.logged(), {start_, tapStarts_,
                        joined(ended(), {"LCRecordingManager:resetStatesForSession:",
                                        "LCClientProxy:stopRecordingWithError:movieURL:"})}) ||
                isMixOf(fakes_.logSink.logged(), {start_, tapStarts_,
                        joined(ended(), {"LCClientProxy:stopRecordingWithError:movieURL:",
                                        "LCRecordingManager:resetStatesForSession:"})}))
        << ::testing::PrintToString(fakes_.logSink.logged());
    EXPECT_EQ(client->toldOfStop(-5806), 1);
}

TEST_F(GoldenLog, AnotherApplicationsStart) {
    const auto client = makeRecording("Player", 500, 7), other = makeConnected("Editor", 501, 8);
    fakes_.logSink.clear();
    other->start();
    settle();
    // The cleaning up is part of the handler; the client is told when the movie has gone.
    EXPECT_TRUE(
        isMixOf(fakes_.logSink.logged(), {start_, tapStarts_,
                joined(ended(), {"LCRecordingSession: cleanupSessionFiles", "LCRecordingManager:resetStatesForSession:",
                                "LCClientProxy:stopRecordingWithError:movieURL:"})}));
}

TEST_F(GoldenLog, AFailureOfTheSource) {
    const auto client = makeRecording();
    fakes_.displayCapture.lastSource()->fail(-3);
    settle();
    EXPECT_EQ(fakes_.logSink.logged(),
              joined(joined({"LCRecordingSession: screenCaptureController: didFailWithStatus:",
                             "LCRecordingSession: stop"},
                            captureStops()),
                     {"LCRecordingManager:recordingSessionStoppedWithError:movieURL:",
                      "LCClientProxy:stopRecordingWithError:movieURL:", "LCRecordingManager:resetStatesForSession:",
                      "recordedFileSize for URL 1000 bytes"}));
}

TEST_F(GoldenLog, AClip) {
    const auto client = makeRecording();
    advance(std::chrono::seconds(10));
    fakes_.logSink.clear();
    client->ask(DaemonMessage::StopRecordingWithClipDurations, {2.0, 3.0});
    settle();
    const auto pictures = std::to_string(fakes_.displayCapture.lastSource()->counters().delivered);
    EXPECT_EQ(
        fakes_.logSink.logged(),
        joined(joined({"LCRecordingManager: stopRecordingWithStartTimeOffset:endTimeOffset:handler:",
               "LCRecordingManager: stopRecordingSession:handler:", "LCRecordingSession: finishSessionWithHandler",
               "LCRecordingSession: stop"}, captureStops()), {
               "recordedFileSize for URL " + pictures + "000 bytes",
               "LCMovieWriter: finishWritingWithHandler: status = 1", "LCRecordingSession: finishWritingWithHandler",
               "trimming", "LCMovieWriter: Export Trim succeeded", "finished trimming",
               "LCRecordingManager:resetStatesForSession:"}));
}

TEST_F(GoldenLog, AClipThatFailsOrIsCancelled) {
    const auto client = makeRecording();
    advance(std::chrono::seconds(10));
    fakes_.faults.failNext("MovieExporter.export");
    client->ask(DaemonMessage::StopRecordingWithClipDurations, {2.0, 3.0});
    settle();
    const Lines lines = fakes_.logSink.logged();
    ASSERT_GE(lines.size(), 2u);
    EXPECT_EQ(lines[lines.size() - 2], "trimming");
    EXPECT_TRUE(lines.back().starts_with("LCMovieWriter: Export Trim Video Failed, due to error: ")) << lines.back();
}

TEST_F(GoldenLog, ADiscardWhileRecordingAndAfterwards) {
    const auto client = makeRecording();
    client->ask(DaemonMessage::DiscardRecording);
    settle();
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{"LCRecordingManager: discardRecording",
                                              "can't discard recording while recording is in progress"}));
    client->ask(DaemonMessage::StopRecording);
    settle();
    fakes_.logSink.clear();
    client->ask(DaemonMessage::DiscardRecording);
    settle();
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager: discardRecording", "LCRecordingSession: cleanupSessionFiles"}));
}

TEST_F(GoldenLog, AResumeWithAWindowOfSomebodyElse) {
    const auto client = makeRecording(), other = makeConnected("Editor", 501, 8);
    client->tell(DaemonMessage::PauseRecording);
    settle();
    fakes_.logSink.clear();
    client->tell(DaemonMessage::ResumeRecording, {number(other->window)});
    settle();
    EXPECT_EQ(fakes_.logSink.logged(), joined(ended(false), {"LCRecordingManager:recordingSessionStoppedWithError:movieURL:",
                                                       "LCClientProxy:stopRecordingWithError:movieURL:",
                                                       "LCRecordingManager:resetStatesForSession:"}));
    EXPECT_EQ(client->toldOfStop(-5816), 1);
}

TEST_F(GoldenLog, AnActivationAndWhatComesBeforeIt) {
    const auto client = makeConnected();
    fakes_.logSink.clear();
    client->tell(DaemonMessage::ClientDidResignActive);
    settle();
    advance(std::chrono::seconds(481));
    client->tell(DaemonMessage::ClientDidBecomeActive);
    client->tell(DaemonMessage::SetMicrophoneEnabled, {true});
    client->tell(DaemonMessage::UpdateProcessIDForAudioCapture, {12});
    settle();
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"LCRecordingManager:clientDidResignActiveWithBundleID:",
                     "LCRecordingManager:clientDidBecomeActiveWithBundleID:",
                     "LCRecordingManager:removeAcknowledgementExemptionIfOverThreshholdForBundleID:",
                     "removedExemption", "LCRecordingManager: setMicrophoneEnabled:1",
                     "LCRecordingManager: updateProcessIDForAudioCaptureWithPID:12"}));
}

TEST_F(GoldenLog, TheRefusalsOfAStart) {
    const auto client = makeConnected();
    const std::string head =
        "LCRecordingManager:startRecordingWindowLayerContextID:windowSize:microphoneEnabled:streaming:withHandler:";
    const auto linesOf = [&](const std::function<void()>& start) {
        fakes_.logSink.clear();
        start();
        settle();
        Lines lines = fakes_.logSink.logged();
        // The last line is for the administrator: the request's number and the reason.
        EXPECT_TRUE(lines.back().starts_with("start request ")) << lines.back();
        lines.pop_back();
        return lines;
    };
    EXPECT_EQ(linesOf([&] { client->start({ContextID{99}}); }), Lines());
    fakes_.fileSystem.setFreeSize(100'000'000);
    EXPECT_EQ(linesOf([&] { client->start(); }),
              (Lines{head, "LCRecordingManager:stopCurrentRecordingSession:",
                     "insufficient disk space for recording, calling handler with error"}));
    fakes_.fileSystem.setFreeSize(1'000'000'000);
    fakes_.appStateMonitor.setState(client->id, 4);
    EXPECT_EQ(linesOf([&] { client->start(); }), (Lines{head, "LCRecordingManager:stopCurrentRecordingSession:",
                                                        "app is not in the foreground, calling handler with error"}));
    fakes_.appStateMonitor.setState(client->id, 8);
    EXPECT_EQ(
        linesOf([&] { client->start({client->window}, {.broadcast = true}); }),
        (Lines{head, "LCRecordingManager:stopCurrentRecordingSession:", "LCRecordingManager: suppressAlert=1",
               "starting...", "broadcast requested", "attempted to start broadcast without a session, bailing out",
               "LCRecordingManager:resetStatesForSession:"}));
}

TEST_F(GoldenLog, TheLinesOfEveryFrameAreKeptInTheRingInTheirOrder) {
    const auto client = makeRecording();
    fakes_.displayCapture.lastSource()->deliverFrame();
    advance(std::chrono::milliseconds(20));
    const Lines ring = fakes_.log.recentLines();
    const Lines frame{
        "Screen sampled at w:640 h:360",
        "LCRecordingSession:screenCaptureController:didReceiveSampleBuffer:transformFlags:", "appending video sample"};
    EXPECT_NE(std::search(ring.begin(), ring.end(), frame.begin(), frame.end()), ring.end());
    EXPECT_EQ(logged(frame[0]), 0u) << "they reach the platform's log only when asked for";
}

}  // namespace
}  // namespace lumacast
