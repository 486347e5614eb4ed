#pragma once
// Small private screens that are mirrored.

#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <string>

#include "linux/display/X11DisplayCapture.h"
#include "linux/system/LinuxClock.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/TestScreen.h"
#include "tests/contract/TestWindow.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast::test {

/// A small screen of any shape, with a pointer in the top left corner that can't be seen.
class MirrorWorld {
public:
    explicit MirrorWorld(int width, int height)
        : display(std::to_string(width) + "x" + std::to_string(height) + "x24"), screen(display.name()) {
        screen.setPointer(nothing);
        screen.movePointer(0, 0);
        clock.startCaptureClock();
        capture.setMirroringMode(DisplayCloneControl::kMirrorDisplay);
        frames->keepPlanes = true;
        frames->checkEvery = 50;
    }
    std::shared_ptr<DisplayCaptureSource> start(int width, int height, int perSecond = 60) {
        return start(frames, width, height, perSecond);
    }
    std::shared_ptr<DisplayCaptureSource> start(const std::shared_ptr<CapturedFrames>& into, int width, int height,
                                                int perSecond = 60) {
        auto made = capture.makeSource({static_cast<double>(width), static_cast<double>(height)},
                                       MediaTime::make(1, perSecond));
        made->setDelegate(into);
        made->openGate();
        made->start();
        return made;
    }
    /// Until the newest frame, seen upright, is this.
    bool shows(const Pixels& pixels, std::chrono::milliseconds limit = kGenerous) {
        return frames->waitFor(
            [&](const CapturedFrames::Frames& got) { return !got.empty() && upright(got.back()) == pixels; }, limit);
    }
    static Pixels upright(const CapturedFrame& frame) { return uprightPixels(*frame.plane, frame.transformFlags); }

    const TestScreen::PointerLook nothing = TestScreen::square(8, 0);
    const PrivateDisplay display;
    TestScreen screen;
    LinuxClock clock;
    const std::shared_ptr<ThreadLoop> loop = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler{loop};
    RunningThreadLoop running{*loop};
    X11DisplayCapture capture{display.name(), clock, scheduler};
    const std::shared_ptr<CapturedFrames> frames = std::make_shared<CapturedFrames>();
};

class LandscapeMirror : public ::testing::Test, protected MirrorWorld {
protected:
    LandscapeMirror() : MirrorWorld(400, 300) {}
    TestWindow back{display.name(), {.place = {0, 0, 400, 300}, .colour = 0xC01020, .repaints = false}};
};

class PortraitMirror : public ::testing::Test, protected MirrorWorld {
protected:
    PortraitMirror() : MirrorWorld(300, 400) {}
    TestWindow back{display.name(), {.place = {0, 0, 300, 400}, .colour = 0xC01020, .repaints = false}};
};

}  // namespace lumacast::test
