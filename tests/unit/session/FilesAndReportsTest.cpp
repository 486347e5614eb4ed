// A session's file names, the size of its file, and its usage report.

#include "tests/unit/session/SessionWorld.h"

namespace lumacast {
namespace {

using std::chrono::seconds;

class SessionFiles : public SessionWorld {};

TEST_F(SessionFiles, AMovieIsNamedAfterItsApplication) {
    EXPECT_EQ(session_->outputPath(), path_);
    EXPECT_EQ(session_->outputURL(), URL("file://" + path_));
    EXPECT_EQ(session_->trimmedOutputPath(), clipPath_);
    EXPECT_EQ(session_->trimmedOutputURL(), URL("file://" + clipPath_));
}

TEST_F(SessionFiles, ASystemRecordingIsNamedAfterTheLocalSecondOfTheCall) {
    session_->setSystemRecording(true);
    fakes_.clock.setTimeZone(3600);
    EXPECT_EQ(session_->outputPath(), "/private/var/mobile/Library/Lumacast//ScreenRecording_01-15-2026 13-00-00.mp4");
    advance(seconds(61));
    EXPECT_EQ(session_->outputPath(), "/private/var/mobile/Library/Lumacast//ScreenRecording_01-15-2026 13-01-01.mp4");
    EXPECT_EQ(session_->trimmedOutputPath(), clipPath_);
}

TEST_F(SessionFiles, TheWriterKeepsThePathOfTheStart) {
    session_->setSystemRecording(true);
    start();
    advance(seconds(5));
    EXPECT_EQ(session_->movieWriter()->outputPath(),
              "/private/var/mobile/Library/Lumacast//ScreenRecording_01-15-2026 12-00-00.mp4");
    EXPECT_EQ(session_->outputPath(), "/private/var/mobile/Library/Lumacast//ScreenRecording_01-15-2026 12-00-05.mp4");
}

TEST_F(SessionFiles, TheRecordedSizeIsThatOfTheFileAndIsLogged) {
    start();
    EXPECT_EQ(session_->getRecordedFileSize(), 1000u);
    EXPECT_EQ(logged("recordedFileSize for URL 1000 bytes"), 1u);
}

TEST_F(SessionFiles, AnUnreadableSizeIsLoggedAndCountsAsZero) {
    start();
    fakes_.faults.failNext("FileSystem.attributes");
    EXPECT_EQ(session_->getRecordedFileSize(), 0u);
    EXPECT_EQ(logged("error getting recordedFileSize :110"), 1u);
}

TEST_F(SessionFiles, TheSizeOfABroadcastOrACaptureIsZeroWithoutALook) {
    for (const bool broadcast : {true, false}) {
        session_->setIsBroadcasting(broadcast);
        session_->setCaptureRecording(!broadcast);
        start();
        fakes_.faults.failNext("FileSystem.attributes");
        EXPECT_EQ(session_->getRecordedFileSize(), 0u);
        EXPECT_EQ(logged("error getting recordedFileSize :110"), 0u) << "the file system was asked";
        fakes_.faults.clear();
        cleanUp();
    }
}

TEST_F(SessionFiles, ACleanUpOfASystemRecordingLooksForTheSecondOfTheCallAndLeavesItsFile) {
    session_->setSystemRecording(true);
    start();
    const std::string written = session_->movieWriter()->outputPath();
    advance(seconds(5));
    fakes_.logSink.clear();
    EXPECT_EQ(cleanUp(), 1);
    EXPECT_TRUE(fakes_.fileSystem.exists(written));
    EXPECT_EQ(logged("error getting recordedFileSize :2"), 1u);
    EXPECT_EQ(metric(events().at(0), "RecordedFileSize"), Value(std::uint64_t{0}));
}

class SessionReports : public SessionWorld {};

TEST_F(SessionReports, TheServiceIsNamedBySystemThenBroadcastThenCapture) {
    const auto nameOf = [&](bool system, bool broadcast, bool capture) {
        session_->setSystemRecording(system);
        session_->setIsBroadcasting(broadcast);
        session_->setCaptureRecording(capture);
        return session_->_serviceNameForReporting();
    };
    EXPECT_EQ(nameOf(true, true, true), "SystemBroadcast");
    EXPECT_EQ(nameOf(true, false, true), "SystemRecording");
    EXPECT_EQ(nameOf(false, true, true), "InAppBroadcast");
    EXPECT_EQ(nameOf(false, false, true), "InAppCapture");
    EXPECT_EQ(nameOf(false, false, false), "InAppRecording");
}

TEST_F(SessionReports, ARecordingIsReportedOnceWhenItStops) {
    start();
    advance(seconds(3));  // still: one picture a second
    finish();
    ASSERT_EQ(events().size(), 1u);
    const auto event = events()[0];
    EXPECT_EQ(event.type, 1);
    EXPECT_EQ(event.user.serviceName, "InAppRecording");
    EXPECT_EQ(metric(event, "ActiveDuration"), Value(std::int64_t{3}));
    EXPECT_EQ(metric(event, "VideoCaptureWidth"), Value(std::int64_t{640}));
    EXPECT_EQ(metric(event, "VideoCaptureHeight"), Value(std::int64_t{360}));
    EXPECT_EQ(metric(event, "VideoCaptureRate"), Value(std::int64_t{60}));
    EXPECT_EQ(metric(event, "VideoFrameCount"), Value(static_cast<std::int64_t>(source()->counters().delivered)));
    EXPECT_EQ(metric(event, "RecordedFileSize"), Value(std::uint64_t{1000 * source()->counters().delivered}));
    EXPECT_EQ(metric(event, "EndReason"), Value(std::int64_t{0}));
    EXPECT_FALSE(session_->reportingAgent());
}

TEST_F(SessionReports, TheSizeReportedIsThatOfTheCapture) {
    session_->setWindowSize({2560, 1440});
    start();
    finish();
    EXPECT_EQ(metric(events().at(0), "VideoCaptureWidth"), Value(std::int64_t{1920}));
    EXPECT_EQ(metric(events().at(0), "VideoCaptureHeight"), Value(std::int64_t{1080}));
}

TEST_F(SessionReports, TheEndReasonIsTheErrorsCode) {
    start();
    source()->preempt();
    settle();
    ASSERT_EQ(events().size(), 1u);
    EXPECT_EQ(metric(events()[0], "EndReason"), Value(std::int64_t{-5806}));
}

TEST_F(SessionReports, ThePausedStretchIsNotActiveButAStopWhilePausedCountsFromTheLastStart) {
    start();
    advance(seconds(2));
    pause();
    advance(seconds(10));
    resume();
    advance(seconds(3));
    EXPECT_NEAR(session_->activeDuration(), 5, 0.01);
    finish();
    EXPECT_EQ(metric(events()[0], "ActiveDuration"), Value(std::int64_t{5}));
    start();
    advance(seconds(2));
    pause();
    advance(seconds(10));
    finish();
    EXPECT_EQ(metric(events()[1], "ActiveDuration"), Value(std::int64_t{2 + 12}));
}

TEST_F(SessionReports, EitherCameraSetsTheFrontFlag) {
    for (const std::int32_t position : {1, 2}) {
        start();
        session_->sessionReportCameraUsage(position);
        const UsageMetrics metrics = session_->reportingAgent()->metrics();
        EXPECT_TRUE(metrics.frontCameraUsed) << position;
        EXPECT_FALSE(metrics.backCameraUsed) << position;
        cleanUp();
    }
    start();
    session_->reportingAgent()->update([](UsageMetrics& metrics) { metrics.backCameraUsed = true; });
    session_->sessionReportCameraUsage(1);
    EXPECT_FALSE(session_->reportingAgent()->metrics().frontCameraUsed) << "the back camera was in use already";
    session_->sessionReportCameraUsage(2);
    EXPECT_TRUE(session_->reportingAgent()->metrics().frontCameraUsed);
    cleanUp();
    start();
    session_->sessionReportCameraUsage(3);
    session_->sessionReportCameraUsage(0);
    EXPECT_FALSE(session_->reportingAgent()->metrics().frontCameraUsed);
}

}  // namespace
}  // namespace lumacast
