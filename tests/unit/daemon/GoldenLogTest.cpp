// The log of a whole recording, line by line. Written by hand, not copied from a run.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

class GoldenLog : public DaemonWorld {};

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
    const Lines expected{
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
        "starting capture",
        "recording session started",
        // The pause.
        "LCRecordingManager:pauseRecording",
        "LCRecordingSession: pauseSession",
        "LCRecordingSession: stopAllCapture",
        "Stop mirroring",
        // The resume; the source's repeat of its last picture is dropped.
        "LCRecordingManager: resumeRecording",
        "LCRecordingSession: resumeSessionWithContextID:",
        "app window mode",
        "starting capture",
        // The stop.
        "LCRecordingManager: stopRecordingWithHandler:",
        "LCRecordingManager: stopRecordingWithStartTimeOffset:endTimeOffset:handler:",
        "LCRecordingManager: stopRecordingSession:handler:",
        "LCRecordingSession: finishSessionWithHandler",
        "LCRecordingSession: stop",
        "LCRecordingSession: stopAllCapture",
        "Stop mirroring",
        // One picture at the start, and one at the resume beside the repeat.
        "recordedFileSize for URL 2000 bytes",
        "LCMovieWriter: finishWritingWithHandler: status = 1",
        "LCRecordingSession: finishWritingWithHandler",
        "LCRecordingManager:resetStatesForSession:",
    };
    EXPECT_EQ(fakes_.logSink.logged(), expected);
    ASSERT_EQ(fakes_.logSink.printed().size(), 1u);
    EXPECT_TRUE(
        fakes_.logSink.printed()[0].starts_with("LCReportingAgent: reportingEvent:1 payload:{\"ActiveDuration\" = 1;"))
        << fakes_.logSink.printed()[0];
}

TEST_F(GoldenLog, TheLinesOfEveryFrameAreKeptInTheRingInTheirOrder) {
    const auto client = makeRecording();
    fakes_.displayCapture.lastSource()->deliverFrame();
    advance(std::chrono::milliseconds(20));
    const Lines ring = fakes_.log.recentLines();
    const Lines frame{"Screen sampled at w:640 h:360",
                      "LCRecordingSession:screenCaptureController:didReceiveSampleBuffer:transformFlags:",
                      "appending video sample"};
    EXPECT_NE(std::search(ring.begin(), ring.end(), frame.begin(), frame.end()), ring.end());
    EXPECT_EQ(logged(frame[0]), 0u) << "they reach the platform's log only when asked for";
}

}  // namespace
}  // namespace lumacast
