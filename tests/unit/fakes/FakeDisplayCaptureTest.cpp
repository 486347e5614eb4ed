#include "tests/fakes/FakeDisplayCapture.h"

#include <gtest/gtest.h>

#include <limits>

#include "tests/fakes/FakePlatform.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

class Frames final : public DisplayCaptureDelegate {
public:
    void screenCaptureControllerDidReceiveSampleBuffer(DisplayCaptureSource& source, const SampleRef& sample,
                                                       std::uint32_t) override {
        stamps.push_back(sample->presentationTime().value);
        if (keep) kept.push_back(sample);
        if (onFrame) onFrame(source);
    }
    void screenCaptureControllerDidFailWithStatus(DisplayCaptureSource&, std::int32_t status) override {
        failures.push_back(status);
    }
    void screenCaptureControllerWasPreempted(DisplayCaptureSource&) override { failures.push_back(1000); }
    void screenCaptureControllerMediaServicesWereReset(DisplayCaptureSource&) override { failures.push_back(2000); }

    std::vector<std::int64_t> stamps;  ///< nanoseconds
    std::vector<SampleRef> kept;
    std::vector<std::int32_t> failures;
    bool keep = false;
    std::function<void(DisplayCaptureSource&)> onFrame;
};

class FakeDisplayCaptureTest : public ::testing::Test {
protected:
    ~FakeDisplayCaptureTest() override { world.scheduler.endWorld(); }
    void makeSource() {
        source = std::static_pointer_cast<FakeDisplayCaptureSource>(
            world.fakes.displayCapture.makeSource({640.9, 361.2}, MediaTime::make(1, 100)));
        source->setDelegate(frames);
    }
    void startRecording() {
        world.fakes.clock.startCaptureClock();
        makeSource();
        source->openGate();
        source->start();
        world.scheduler.runUntilIdle();
    }
    static constexpr std::int64_t kMillisecond = 1'000'000;

    SimWorld world{1};
    std::shared_ptr<Frames> frames = std::make_shared<Frames>();
    std::shared_ptr<FakeDisplayCaptureSource> source;
};

TEST_F(FakeDisplayCaptureTest, NothingComesBeforeTheGateIsOpenOrBeforeARecording) {
    makeSource();
    source->openGate();
    source->start();
    world.scheduler.advance(2s);
    EXPECT_TRUE(frames->stamps.empty()) << "there is no recording";
    world.fakes.clock.startCaptureClock();
    source->start();
    world.scheduler.advance(2s);
    EXPECT_TRUE(frames->stamps.empty()) << "the gate is closed";
}

TEST_F(FakeDisplayCaptureTest, TheFirstPictureComesAtOnceAtZeroAndStartsTheClock) {
    world.scheduler.advance(5s);
    world.fakes.clock.startCaptureClock();
    EXPECT_FALSE(world.fakes.clock.captureClock()->isRunning());
    makeSource();
    frames->keep = true;
    source->openGate();
    source->start();
    source->start();
    world.scheduler.runUntilIdle();
    EXPECT_EQ(frames->stamps, (std::vector<std::int64_t>{0}));
    EXPECT_TRUE(world.fakes.clock.captureClock()->isRunning());
    EXPECT_EQ(frames->kept[0]->image()->width(), 640u);
    EXPECT_EQ(frames->kept[0]->image()->height(), 361u);
    EXPECT_EQ(compare(frames->kept[0]->duration(), MediaTime::make(1, 100)), 0);
}

TEST_F(FakeDisplayCaptureTest, AStillScreenComesOnceASecondAndAChangingOneEveryInterval) {
    startRecording();
    world.scheduler.advance(2500ms);
    EXPECT_EQ(frames->stamps, (std::vector<std::int64_t>{0, 1000 * kMillisecond, 2000 * kMillisecond}));
    frames->stamps.clear();
    world.fakes.displayCapture.setAutomatic(true);
    world.scheduler.advance(50ms);
    EXPECT_EQ(frames->stamps.size(), 5u);
}

TEST_F(FakeDisplayCaptureTest, AfterAPauseTheLastPictureComesAgainThenTheCurrentOneWithoutAGap) {
    startRecording();
    world.scheduler.advance(300ms);
    source->deliverFrame();
    world.scheduler.advance(200ms);
    source->closeGate(GateWait::UntilDelivered);
    world.scheduler.advance(10s);
    source->deliverFrame();
    source->start();
    world.scheduler.advance(1s);
    EXPECT_EQ(frames->stamps.size(), 2u) << "closed";
    source->openGate();
    source->start();
    world.scheduler.runUntilIdle();
    EXPECT_EQ(frames->stamps,
              (std::vector<std::int64_t>{0, 300 * kMillisecond, 300 * kMillisecond, 500 * kMillisecond}));
}

TEST_F(FakeDisplayCaptureTest, AnotherRecordingBeginsAtZeroWithoutARepeat) {
    startRecording();
    world.scheduler.advance(300ms);
    source->closeGate(GateWait::No);
    world.fakes.clock.startCaptureClock();
    source->openGate();
    source->start();
    world.scheduler.runUntilIdle();
    EXPECT_EQ(frames->stamps, (std::vector<std::int64_t>{0, 0}));
}

TEST_F(FakeDisplayCaptureTest, ClosingWaitsForADeliveryInProgressAtMostAHundredMilliseconds) {
    startRecording();
    const auto release = world.scheduler.semaphore(0);
    bool delivered = false;
    frames->onFrame = [&](DisplayCaptureSource&) {
        release->wait();
        delivered = true;
    };
    source->deliverFrame();
    world.scheduler.runUntilIdle();
    const std::int64_t before = world.scheduler.now().nanoseconds;
    source->closeGate(GateWait::UntilDelivered);
    EXPECT_EQ(world.scheduler.now().nanoseconds - before, 100 * kMillisecond);
    EXPECT_FALSE(delivered);
    EXPECT_FALSE(world.fakes.clock.captureClock()->isRunning());
    release->signal();
    world.scheduler.runUntilIdle();
    EXPECT_TRUE(delivered);
}

TEST_F(FakeDisplayCaptureTest, AfterClosingWithAWaitNothingIsDeliveredUnderAnySeed) {
    for (std::uint64_t seed = 0; seed < 100; ++seed) {
        SimWorld other(seed);
        const auto its = std::make_shared<Frames>();
        bool closed = false;
        its->onFrame = [&](DisplayCaptureSource&) {
            EXPECT_FALSE(closed) << seed;
            other.scheduler.semaphore(1)->wait();
            EXPECT_FALSE(closed) << seed;
        };
        other.fakes.clock.startCaptureClock();
        other.fakes.displayCapture.setAutomatic(true);
        const auto made = other.fakes.displayCapture.makeSource({64, 64}, MediaTime::make(1, 100));
        made->setDelegate(its);
        made->openGate();
        made->start();
        other.scheduler.globalQueue(QueuePriority::Default).async([&] {
            (void)other.scheduler.semaphore(0)->waitFor(50ms);
            made->closeGate(GateWait::UntilDelivered);
            closed = true;
        });
        other.scheduler.advance(200ms);
        EXPECT_TRUE(closed);
        EXPECT_GE(its->stamps.size(), 5u);
        other.scheduler.endWorld();
    }
}

TEST_F(FakeDisplayCaptureTest, ClosingFromWithinADeliveryDoesNotWait) {
    startRecording();
    bool closed = false;
    frames->onFrame = [&](DisplayCaptureSource& delivering) {
        const std::int64_t before = world.scheduler.now().nanoseconds;
        delivering.closeGate(GateWait::UntilDelivered);
        EXPECT_EQ(world.scheduler.now().nanoseconds, before);
        closed = true;
    };
    source->deliverFrame();
    world.scheduler.advance(2s);
    EXPECT_TRUE(closed);
    EXPECT_EQ(frames->stamps.size(), 2u);
}

TEST_F(FakeDisplayCaptureTest, HeldPlanesCostPicturesWhichAreCounted) {
    world.fakes.displayCapture.setPlanes(3);
    frames->keep = true;
    startRecording();
    for (int i = 0; i < 5; ++i) source->deliverFrame();
    world.scheduler.runUntilIdle();
    EXPECT_EQ(frames->stamps.size(), 3u);
    EXPECT_EQ(source->counters().delivered, 3u);
    EXPECT_EQ(source->counters().dropped, 3u);
    frames->kept.clear();
    source->deliverFrame();
    world.scheduler.runUntilIdle();
    EXPECT_EQ(frames->stamps.size(), 4u);
}

TEST_F(FakeDisplayCaptureTest, AFailureEndsDeliveryAndIsToldOnTheMainQueueOnce) {
    startRecording();
    source->fail(-42);
    EXPECT_TRUE(frames->failures.empty()) << "not inline";
    world.scheduler.advance(3s);
    EXPECT_EQ(frames->failures, (std::vector<std::int32_t>{-42}));
    EXPECT_EQ(frames->stamps.size(), 1u);
    source->start();
    world.scheduler.runUntilIdle();
    source->preempt();
    source->mediaServicesWereReset();
    world.scheduler.runUntilIdle();
    EXPECT_EQ(frames->failures, (std::vector<std::int32_t>{-42, 1000, 2000}));
}

TEST_F(FakeDisplayCaptureTest, ASizeThatNoPictureHasFailsAfterTheStart) {
    constexpr double kHuge = std::numeric_limits<double>::max(), kNone = std::numeric_limits<double>::quiet_NaN();
    for (const Size size : {Size{0.5, 360}, Size{640, kNone}, Size{-1, -1}, Size{kHuge, 360}, Size{640, 16'385}}) {
        frames->failures.clear();
        const auto bad = world.fakes.displayCapture.makeSource(size, MediaTime::make(1, 100));
        bad->setDelegate(frames);
        world.fakes.clock.startCaptureClock();
        bad->openGate();
        bad->start();
        world.scheduler.advance(1s);
        EXPECT_EQ(frames->failures, std::vector<std::int32_t>{FakeDisplayCapture::kStartFailed}) << size.width;
        EXPECT_TRUE(frames->stamps.empty());
    }
}

TEST_F(FakeDisplayCaptureTest, TheLastReferenceMayGoWithinADelivery) {
    startRecording();
    frames->onFrame = [&](DisplayCaptureSource&) { source.reset(); };
    source->deliverFrame();
    world.scheduler.advance(3s);
    EXPECT_EQ(frames->stamps.size(), 2u);
    EXPECT_TRUE(world.fakes.displayCapture.sources().empty());
}

TEST_F(FakeDisplayCaptureTest, ANewContainerWriterIsGivenAPictureAtOnce) {
    startRecording();
    world.scheduler.advance(500ms);
    ASSERT_FALSE(world.fakes.fileSystem.createDirectory(world.fakes.fileSystem.temporaryDirectory()));
    const auto writer = world.fakes.containerWriters.make(
        URL::file(world.fakes.fileSystem.temporaryDirectory() + "/movie.mp4"), ContainerType::Mpeg4);
    ASSERT_TRUE(std::holds_alternative<std::unique_ptr<ContainerWriter>>(writer));
    world.scheduler.runUntilIdle();
    EXPECT_EQ(frames->stamps, (std::vector<std::int64_t>{0, 500 * kMillisecond}));
}

}  // namespace
}  // namespace lumacast
