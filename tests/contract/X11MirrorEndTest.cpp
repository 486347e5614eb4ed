// What ends the mirroring of a screen.

#include <gtest/gtest.h>

#include "linux/display/CaptureStatus.h"
#include "tests/contract/Colours.h"
#include "tests/contract/MirrorWorld.h"
#include "tests/contract/PoweredDisplay.h"

namespace lumacast::test {
namespace {

TEST_F(LandscapeMirror, IsPreemptedOnceWhenTheScreenIsBlankedAndGoesOnAfterIt) {
    const auto made = start(400, 300);
    ASSERT_TRUE(shows(screen.withoutPointer()));
    std::thread::id mainThread;
    loop->sync([&] { mainThread = std::this_thread::get_id(); });
    screen.saveScreen(true);
    ASSERT_TRUE(frames->waitForPreemptions(1));
    EXPECT_EQ(frames->failureThread(), mainThread);
    const std::size_t count = frames->count();
    screen.movePointer(50, 50);
    back.paint(kGreen);
    screen.saveScreen(true);
    // Another source is told when it begins, without a picture.
    const auto later = std::make_shared<CapturedFrames>();
    const auto other = start(later, 400, 300);
    ASSERT_TRUE(later->waitForPreemptions(1));
    EXPECT_EQ(later->count(), 0u);
    EXPECT_EQ(frames->preemptions(), 1u);
    EXPECT_EQ(frames->count(), count) << "what the screen shows then is nobody's business";
    screen.saveScreen(false);
    for (const auto& source : {made, other}) source->start();
    ASSERT_TRUE(shows(screen.withoutPointer()));
    ASSERT_TRUE(later->waitForCount(1));
    EXPECT_EQ(later->preemptions(), 1u);
    EXPECT_TRUE(frames->failures().empty());
}

TEST_F(LandscapeMirror, TellsThatTheMediaServicesWereResetWhenTheServerDies) {
    const auto made = start(400, 300);
    ASSERT_TRUE(frames->waitForCount(1));
    std::thread::id mainThread;
    loop->sync([&] { mainThread = std::this_thread::get_id(); });
    display.crash();
    ASSERT_TRUE(frames->waitForReset());
    EXPECT_EQ(frames->failureThread(), mainThread);
    made->start();
    EXPECT_EQ(frames->waitForFailure(), CaptureStatus::kNoDisplay);
    EXPECT_EQ(frames->resets(), 1u);
    EXPECT_EQ(frames->preemptions(), 0u);
}

TEST_F(LandscapeMirror, IsPreemptedWhenTheMonitorsAreTurnedOff) {
    PoweredDisplay powered(display.name());
    X11DisplayCapture behind(powered.name(), clock, scheduler);
    behind.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
    const auto made = behind.makeSource({400, 300}, MediaTime::make(1, 60));
    made->setDelegate(frames);
    made->openGate();
    std::size_t preemptions = 0;
    for (const auto power : {PoweredDisplay::Standby, PoweredDisplay::Suspend, PoweredDisplay::Off}) {
        powered.set(PoweredDisplay::On);
        frames->clear();
        made->start();
        ASSERT_TRUE(frames->waitForCount(3)) << "for all the questions: " << powered.questions();
        EXPECT_EQ(frames->preemptions(), preemptions);
        powered.set(power);
        ASSERT_TRUE(frames->waitForPreemptions(++preemptions));
        // Off at the start.
        const std::size_t count = frames->count();
        made->start();
        ASSERT_TRUE(frames->waitForPreemptions(++preemptions));
        EXPECT_LE(frames->count(), count + 1) << "at most the last picture once more";
    }
    // Off while it was paused, however shortly.
    powered.set(PoweredDisplay::On);
    frames->clear();
    made->start();
    ASSERT_TRUE(frames->waitForCount(2));
    made->closeGate(GateWait::UntilDelivered);
    made->openGate();
    powered.set(PoweredDisplay::Off);
    const std::size_t count = frames->count();
    made->start();
    ASSERT_TRUE(frames->waitForPreemptions(++preemptions));
    EXPECT_LE(frames->count(), count + 1) << "at most the last picture once more";
    EXPECT_GT(powered.questions(), 6);
    EXPECT_TRUE(frames->failures().empty());
}

}  // namespace
}  // namespace lumacast::test
