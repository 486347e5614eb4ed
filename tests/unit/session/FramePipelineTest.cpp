// The road of a frame: dropped, re-timed, delivered. The pictures are the test's own, so that their times are known.

#include "tests/unit/session/SessionWorld.h"

namespace lumacast {
namespace {

constexpr char kSampled[] = "Screen sampled at w:640 h:360";
constexpr char kProcessed[] = "LCRecordingSession:screenCaptureController:didReceiveSampleBuffer:transformFlags:";
constexpr char kDiscarded[] = "session is paused discard sample";

class FramePipeline : public SessionWorld {
protected:
    /// Starts with a source that delivers nothing of its own: the session is then given pictures by the test.
    void startQuietly() {
        fakes_.displayCapture.setPlanes(0);
        start();
        fakes_.logSink.clear();
    }
    /// A pause and a resume, during which the test delivers nothing.
    void interruption() {
        pause();
        resume();
    }
};

TEST_F(FramePipeline, AMissingSampleIsIgnored) {
    startQuietly();
    session_->screenCaptureControllerDidReceiveSampleBuffer(*source(), nullptr, 0);
    EXPECT_TRUE(fakes_.logSink.lines().empty());
    EXPECT_TRUE(delegate_->durations.empty());
}

TEST_F(FramePipeline, EveryFrameIsLoggedAndCounted) {
    startQuietly();
    deliver(1000);
    deliver(1010);
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{kSampled, kProcessed, kSampled, kProcessed, "appending video sample"}));
    EXPECT_EQ(ticks(), (Ticks{1000, 1010}));
    EXPECT_EQ(session_->reportingAgent()->metrics().videoFrameCount, 2);
}

TEST_F(FramePipeline, TheReportedDurationRunsFromTheFirstFrameEverPausesIncluded) {
    startQuietly();
    deliver(600);
    deliver(1200);
    interruption();
    deliver(6600);
    finish();
    startQuietly();
    deliver(7200);
    EXPECT_EQ(delegate_->durations, (std::vector<double>{0, 1, 10, 11}));
}

TEST_F(FramePipeline, AFirstFrameAtZeroLeavesTheFirstTimeToTheNext) {
    startQuietly();
    deliver(0);
    deliver(600);
    deliver(1200);
    EXPECT_EQ(delegate_->durations, (std::vector<double>{0, 0, 1}));
}

TEST_F(FramePipeline, TheFirstFrameSetsTheCaptureStartTime) {
    startQuietly();
    deliver(1000);
    deliver(1010);
    EXPECT_EQ(compare(captureManager_->captureStartTime(), MediaTime::make(1000, 600)), 0);
}

TEST_F(FramePipeline, AfterAPauseTheFirstFrameHasTheTimeOfTheLastOneBefore) {
    startQuietly();
    for (const std::int64_t value : {1000, 1010, 1020}) deliver(value);
    interruption();
    for (const std::int64_t value : {5000, 5010, 5025}) deliver(value);
    // The frame with the equal time is dropped by the writer.
    EXPECT_EQ(logged("discarding video sample buffer due to timestamp earlier than previous"), 1u);
    EXPECT_EQ(ticks(), (Ticks{1000, 1010, 1020, 1030, 1045}));
}

TEST_F(FramePipeline, TwoPausesAddTheirGaps) {
    startQuietly();
    for (const std::int64_t value : {1000, 1010}) deliver(value);
    interruption();
    for (const std::int64_t value : {2000, 2010}) deliver(value);
    interruption();
    for (const std::int64_t value : {3000, 3010}) deliver(value);
    // 2000 - 1010 = 990, then 3000 - 2010 = 990 more: the last times are those of the frames as they came.
    EXPECT_EQ(ticks(), (Ticks{1000, 1010, 1020, 1030}));
}

TEST_F(FramePipeline, TheFirstFrameAfterAResumeLeavesTheLastTimeAlone) {
    startQuietly();
    deliver(1000);
    deliver(1010);
    interruption();
    deliver(2000);  // the gap's frame, and the only one of this stretch
    interruption();
    deliver(3000);
    deliver(3010);
    // 990, then 3000 - 1010 = 1990 more.
    EXPECT_EQ(recording().movie().tracks[0].samples.size(), 2u);
    EXPECT_EQ(logged("discarding video sample buffer due to timestamp earlier than previous"), 3u);
}

TEST_F(FramePipeline, AResumeBeforeAnyFrameTakesTheWholeTimeOff) {
    startQuietly();
    interruption();
    for (const std::int64_t value : {5000, 5010}) deliver(value);
    EXPECT_EQ(ticks(), (Ticks{0, 10}));
}

TEST_F(FramePipeline, ARetimedFrameIsACopyWithItsPictureAndDuration) {
    startQuietly();
    deliver(1000);
    deliver(1010);
    interruption();
    deliver(2000);
    deliver(2010);
    const SampleRef last = recording().movie().tracks[0].samples.back();
    EXPECT_EQ(compare(last->presentationTime(), MediaTime::make(1020, 600)), 0);
    EXPECT_EQ(last->presentationTime().timescale, 600);
    EXPECT_EQ(compare(last->duration(), MediaTime::make(10, 600)), 0);
    EXPECT_FALSE(last->timing()[0].decode.isValid());
    ASSERT_TRUE(last->image());
    EXPECT_EQ(last->image()->width(), 640u);
    EXPECT_EQ(compare(captureManager_->captureStartTime(), MediaTime::make(2010, 600)), 0)
        << "a re-timed frame sets the start to its own time";
}

TEST_F(FramePipeline, EveryTimingEntryOfARetimedFrameHasTheNewTimeAndNoDecodeTime) {
    startQuietly();
    deliver(1000);
    deliver(1010);
    interruption();
    deliver(2000);
    auto plane = std::make_shared<FakePlane>(640, 360, 1, std::vector<PixelRect>{});
    const auto plain = SampleBuffer::makeVideo(PixelBuffer(std::move(plane)), MediaTime::make(2010, 600),
                                               MediaTime::make(10, 600));
    const SampleTiming first{MediaTime::make(4, 600), MediaTime::make(2010, 600), MediaTime::make(2009, 600)};
    const SampleTiming second{MediaTime::make(6, 600), MediaTime::make(2014, 600), MediaTime::make(2013, 600)};
    session_->screenCaptureControllerDidReceiveSampleBuffer(*source(), plain->copyWithTiming({first, second}), 0);
    const auto timing = recording().movie().tracks[0].samples.back()->timing();
    ASSERT_EQ(timing.size(), 2u);
    for (const SampleTiming& entry : timing) {
        EXPECT_EQ(compare(entry.presentation, MediaTime::make(1020, 600)), 0);
        EXPECT_FALSE(entry.decode.isValid());
    }
    EXPECT_EQ(compare(timing[0].duration, MediaTime::make(4, 600)), 0);
    EXPECT_EQ(compare(timing[1].duration, MediaTime::make(6, 600)), 0);
}

TEST_F(FramePipeline, AFinishForgetsThePauses) {
    startQuietly();
    for (const std::int64_t value : {1000, 1010}) deliver(value);
    interruption();
    for (const std::int64_t value : {2000, 2010}) deliver(value);
    finish();
    startQuietly();
    for (const std::int64_t value : {100, 110}) deliver(value);
    EXPECT_EQ(ticks(), (Ticks{100, 110}));
}

TEST_F(FramePipeline, OnlyASystemRecordingIsTurned) {
    startQuietly();
    deliver(1000, 5);
    EXPECT_EQ(recording().transform(0), AffineTransform());
    EXPECT_EQ(logged("rotate clockwise"), 0u);
    finish();
    session_->setSystemRecording(true);
    startQuietly();
    deliver(2000, 3);
    EXPECT_EQ(recording().transform(0), (AffineTransform{-1, 0, 0, -1, 0, 0}));
}

TEST_F(FramePipeline, AFrameDuringAPauseIsDroppedAndLeavesTheLockHeldForTheNext) {
    startQuietly();
    deliver(1000);
    pause();
    fakes_.logSink.clear();
    const auto lane = fakes_.scheduler.serialQueue("other frame lane");
    int done = 0;
    for (const std::int64_t value : {1010, 1020})
        lane->async([this, value, &done] {
            deliver(value);
            ++done;
        });
    settle();
    EXPECT_EQ(done, 1) << "the second frame waits for the lock";
    EXPECT_EQ(logged(kDiscarded), 1u);
    EXPECT_EQ(logged(kProcessed), 2u);
    const auto blocked = world_.scheduler.blockedTasks();
    ASSERT_EQ(blocked.size(), 1u);
    EXPECT_EQ(blocked[0].lane, "other frame lane");
    EXPECT_EQ(blocked[0].waitsFor, "lock");
    EXPECT_EQ(ticks(), Ticks{1000});
}

TEST_F(FramePipeline, TheGateKeepsTheSourceOwnFramesFromThatPath) {
    fakes_.displayCapture.setAutomatic(true);
    start();
    for (int i = 0; i < 50; ++i) {
        advance(std::chrono::milliseconds(40));
        pause();
        advance(std::chrono::milliseconds(40));
        resume();
    }
    EXPECT_EQ(logged(kDiscarded), 0u);
    EXPECT_TRUE(world_.scheduler.blockedTasks().empty());
}

TEST_F(FramePipeline, ADeadSessionDropsFramesSilentlyAndReleasesTheLock) {
    startQuietly();
    deliver(1000);
    session_->screenCaptureControllerMediaServicesWereReset(*source());
    settle();
    fakes_.logSink.clear();
    deliver(1010);
    deliver(1020);
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{kSampled, kProcessed, kSampled, kProcessed}));
    EXPECT_EQ(ticks(), Ticks{1000});
}

TEST_F(FramePipeline, ThePauseIsCutInRawTicksOfTheFramesOwnTimescale) {
    startQuietly();
    deliver(1000);
    deliver(1010);
    interruption();
    // 3000 / 100 is 30 seconds, not 5: only the ticks count, and the last frame's timescale.
    const auto inTicks = [&](std::int64_t value) {
        auto plane = std::make_shared<FakePlane>(640, 360, 1, std::vector<PixelRect>{});
        const auto sample = SampleBuffer::makeVideo(PixelBuffer(std::move(plane)), MediaTime::make(value, 100),
                                                    MediaTime::make(10, 100));
        session_->screenCaptureControllerDidReceiveSampleBuffer(*source(), sample, 0);
    };
    inTicks(3000);
    inTicks(3020);
    EXPECT_EQ(ticks(), (Ticks{1000, 1010, 1030}));
    EXPECT_EQ(recording().movie().tracks[0].samples.back()->presentationTime().timescale, 100);
    EXPECT_DOUBLE_EQ(delegate_->durations.back(), (3020.0 - 1000.0) / 100.0);
}

TEST_F(FramePipeline, AFrameOfAPauseSetsTheFirstTimeBeforeItIsDropped) {
    startQuietly();
    pause();
    const auto lane = fakes_.scheduler.serialQueue("other frame lane");
    for (const std::int64_t value : {600, 1200}) lane->async([this, value] { deliver(value); });
    settle();  // the second frame is counted before it waits for the lock that the first one keeps
    EXPECT_EQ(logged(kDiscarded), 1u);
    EXPECT_EQ(delegate_->durations, (std::vector<double>{0, 1}));
}

TEST_F(FramePipeline, ADiscardedRecordingLeavesItsPausesToTheNext) {
    startQuietly();
    for (const std::int64_t value : {1000, 1010}) deliver(value);
    interruption();
    for (const std::int64_t value : {2000, 2010}) deliver(value);
    cleanUp();
    startQuietly();
    for (const std::int64_t value : {5000, 5010}) deliver(value);
    EXPECT_EQ(ticks(), (Ticks{5000 - 990, 5010 - 990})) << "only a finish forgets them";
}

TEST_F(FramePipeline, AFinishForgetsTheLastTimeToo) {
    startQuietly();
    for (const std::int64_t value : {1000, 1010}) deliver(value);
    finish();
    startQuietly();
    interruption();
    for (const std::int64_t value : {5000, 5010}) deliver(value);
    EXPECT_EQ(ticks(), (Ticks{0, 10})) << "the gap is counted from no frame at all";
}

TEST_F(FramePipeline, AFrameThatComesAfterTheFinishLeavesNothingToTheNextRecording) {
    startQuietly();
    for (const std::int64_t value : {1000, 1010}) deliver(value);
    interruption();
    finish();
    deliver(3000);  // it was on its way
    startQuietly();
    for (const std::int64_t value : {5000, 5010}) deliver(value);
    EXPECT_EQ(ticks(), (Ticks{5000, 5010}));
}

TEST_F(FramePipeline, AResumeThatNoFrameFollowedMeetsTheNextRecording) {
    startQuietly();
    interruption();
    finish();
    startQuietly();
    for (const std::int64_t value : {5000, 5010}) deliver(value);
    EXPECT_EQ(ticks(), (Ticks{0, 10}));
}

TEST_F(FramePipeline, AfterADiscardTheFrameThatEndsTheResumeTakesThePlaceOfTheDiscardedOnesLast) {
    startQuietly();
    for (const std::int64_t value : {1000, 1010}) deliver(value);
    interruption();
    cleanUp();
    startQuietly();
    for (const std::int64_t value : {0, 10}) deliver(value);
    EXPECT_EQ(ticks(), (Ticks{1010, 1020})) << "deliberately: only a finish forgets the time, and only a frame the resume";
}

/// A writer that takes its time.
class SlowWriter final : public LCMovieWriter {
public:
    SlowWriter(const Platform& platform, TempStore& tempStore, std::string path)
        : LCMovieWriter(platform, tempStore, {640, 360}, std::move(path)), goOn(platform.scheduler.semaphore(0)) {}
    bool appendVideoSampleBuffer(const SampleRef&, const AffineTransform&) override {
        goOn->wait();
        return true;
    }
    const std::unique_ptr<Semaphore> goOn;
};

TEST_F(FramePipeline, AResetOfTheMediaServicesWaitsForTheFrameThatIsOnItsWay) {
    startQuietly();
    const auto writer = std::make_shared<SlowWriter>(fakes_.platform(), tempStore_, session_->outputPath());
    session_->setMovieWriter(writer);
    const auto lane = fakes_.scheduler.serialQueue("other frame lane");
    lane->async([this] { deliver(1000); });
    settle();
    session_->screenCaptureControllerMediaServicesWereReset(*source());
    settle();
    EXPECT_TRUE(session_->isRecording()) << "the frame has the lock";
    writer->goOn->signal();
    settle();
    EXPECT_FALSE(session_->isRecording());
    EXPECT_EQ(delegate_->stops, std::vector<std::int64_t>{-5817});
}

/// A writer that takes nothing.
class RefusingWriter final : public LCMovieWriter {
public:
    using LCMovieWriter::LCMovieWriter;
    bool appendVideoSampleBuffer(const SampleRef&, const AffineTransform&) override { return false; }
};

TEST_F(FramePipeline, AWriterThatRefusesAFrameStopsTheRecordingAsNotSaved) {
    startQuietly();
    session_->setMovieWriter(
        std::make_shared<RefusingWriter>(fakes_.platform(), tempStore_, Size{640, 360}, session_->outputPath()));
    deliver(1000);
    EXPECT_EQ(logged("LCRecordingSession: failed to start writer when appending video sample"), 1u);
    EXPECT_EQ(delegate_->stops, std::vector<std::int64_t>{-5812});
    EXPECT_FALSE(session_->isRecording());
    EXPECT_FALSE(source()->isRunning());
}

TEST_F(FramePipeline, AFailedAppendStopsTheRecordingAsNotSaved) {
    // A session that was never started has no writer to append to.
    session_->setRecording(true);
    const auto other = fakes_.displayCapture.makeSource({640, 360}, MediaTime::make(1, 60));
    deliver(1000);
    EXPECT_EQ(logged("LCRecordingSession: failed to start writer when appending video sample"), 1u);
    EXPECT_EQ(delegate_->stops, std::vector<std::int64_t>{-5812});
    EXPECT_FALSE(session_->isRecording());
    deliver(1010);
    EXPECT_EQ(delegate_->stops.size(), 1u) << "it is stopped once, and the lock was released";
}

}  // namespace
}  // namespace lumacast
