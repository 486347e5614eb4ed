#pragma once
// A private display, and sources that capture its windows.

#include <gtest/gtest.h>

#include <memory>
#include <set>
#include <string>

#include "linux/display/X11DisplayCapture.h"
#include "linux/system/LinuxClock.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/TestWindow.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast::test {

class X11CaptureFixture : public ::testing::Test {
protected:
    explicit X11CaptureFixture(const std::string& screen = "2200x1300x24") : display(screen) {
        clock.startCaptureClock();
        frames->checkEvery = 1;
    }

    std::shared_ptr<DisplayCaptureSource> source(int width, int height, int perSecond = 60) {
        auto made = capture.makeSource({static_cast<double>(width), static_cast<double>(height)},
                                       MediaTime::make(1, perSecond));
        made->setDelegate(frames);
        return made;
    }
    std::shared_ptr<DisplayCaptureSource> startOn(const TestWindow& window, int width, int height, int perSecond = 60) {
        return startOn(std::set{window.context()}, width, height, perSecond);
    }
    std::shared_ptr<DisplayCaptureSource> startOn(const std::set<ContextID>& windows, int width, int height,
                                                  int perSecond = 60) {
        capture.setContexts(windows);
        capture.setMirroringMode(DisplayCloneControl::kCloneContexts);
        auto made = source(width, height, perSecond);
        made->openGate();
        made->start();
        return made;
    }

    const PrivateDisplay display;
    LinuxClock clock;
    const std::shared_ptr<ThreadLoop> loop = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler{loop};
    RunningThreadLoop running{*loop};
    X11DisplayCapture capture{display.name(), clock, scheduler};
    const std::shared_ptr<CapturedFrames> frames = std::make_shared<CapturedFrames>();
};

/// What is special about capturing on X11.
class X11Capture : public X11CaptureFixture {};

}  // namespace lumacast::test
