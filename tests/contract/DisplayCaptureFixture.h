#pragma once
// What the suites of display capture share: something to capture on the fake and on both ports.

#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <thread>

#include "headless/display/SyntheticDisplay.h"
#include "headless/display/SyntheticWindows.h"
#include "linux/display/X11DisplayCapture.h"
#include "linux/system/LinuxClock.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/CapturedFrames.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/TestWindow.h"
#include "tests/fakes/FakeDisplayCapture.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast::test {

inline const MediaTime kSixtieth = MediaTime::make(1, 60);

class CaptureWorld {
public:
    virtual ~CaptureWorld() = default;
    virtual DisplayCapture& capture() = 0;
    /// Something changes on what is captured.
    virtual void change() = 0;
    /// Lets the next start of a source fail.
    virtual void letTheNextStartFail() = 0;
    virtual void letStartsSucceed() = 0;
    /// Why what is captured never stands still; empty where it does until change().
    virtual std::string whyNothingStandsStill() const { return {}; }

    Clock& clock() { return clock_; }
    SerialQueue& mainQueue() { return *loop_; }

protected:
    LinuxClock clock_;
    const std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler_{loop_};
    RunningThreadLoop running_{*loop_};
};

class FakeCaptureWorld final : public CaptureWorld {
public:
    DisplayCapture& capture() override { return capture_; }
    void change() override {
        for (const auto& source : capture_.sources()) source->change();
    }
    void letTheNextStartFail() override { faults_.failNext("DisplayCapture.start"); }
    void letStartsSucceed() override { faults_.clear(); }

private:
    FaultPlan faults_;
    FakeDisplayCapture capture_{scheduler_, clock_, faults_};
};

class PortCaptureWorld final : public CaptureWorld {
public:
    PortCaptureWorld() { letStartsSucceed(); }
    DisplayCapture& capture() override { return capture_; }
    void change() override { window_.paint(++colour_); }
    void letTheNextStartFail() override { capture_.setContexts({ContextID{0x7ffffff0}}); }
    void letStartsSucceed() override {
        capture_.setContexts({window_.context()});
        capture_.setMirroringMode(DisplayCloneControl::kCloneContexts);
    }

private:
    PrivateDisplay display_;
    TestWindow window_{display_.name(), {.colour = 1}};
    std::uint32_t colour_ = 1;
    X11DisplayCapture capture_{display_.name(), clock_, scheduler_};
};

/// A window of this process.
class HeadlessCaptureWorld final : public CaptureWorld {
public:
    HeadlessCaptureWorld() { letStartsSucceed(); }
    DisplayCapture& capture() override { return display_; }
    void change() override {}
    void letTheNextStartFail() override { display_.setContexts({ContextID{0x7ffffff0}}); }
    void letStartsSucceed() override {
        display_.setContexts({headless::windowOf(ProcessID{::getpid()})});
        display_.setMirroringMode(DisplayCloneControl::kCloneContexts);
    }
    std::string whyNothingStandsStill() const override { return "what the synthetic display shows moves all the time"; }

private:
    headless::SyntheticDisplay display_{headless::Show(clock_.hostTime()), clock_, scheduler_};
};

using CaptureWorldMaker = std::function<std::unique_ptr<CaptureWorld>()>;

class DisplayCaptureContract : public ::testing::TestWithParam<CaptureWorldMaker> {
protected:
    struct Watched {
        std::shared_ptr<CapturedFrames> frames = std::make_shared<CapturedFrames>();
        std::shared_ptr<DisplayCaptureSource> source;
    };
    Watched make(MediaTime interval = kSixtieth) {
        Watched watched;
        watched.source = world_->capture().makeSource({320, 240}, interval);
        watched.source->setDelegate(watched.frames);
        return watched;
    }
    Watched started(MediaTime interval = kSixtieth) {
        Watched watched = make(interval);
        watched.source->openGate();
        watched.source->start();
        return watched;
    }
    /// Until the source has delivered `count` frames, with something changing all the time.
    bool deliversWithChanges(const Watched& watched, std::size_t count) {
        const auto limit = std::chrono::steady_clock::now() + kGenerous;
        while (watched.frames->count() < count && std::chrono::steady_clock::now() < limit) {
            const std::size_t before = watched.frames->count();
            world_->change();
            watched.frames->waitFor([&](const CapturedFrames::Frames& got) { return got.size() > before; }, std::chrono::milliseconds(200));
        }
        return watched.frames->count() >= count;
    }
    /// Time in which another source delivers several frames.
    void letTimePass(std::size_t frames = 5) {
        const Watched other = started();
        EXPECT_TRUE(deliversWithChanges(other, frames));
        other.source->stop();
    }
    /// Nothing but time: another source would let the clock run.
    static void passTime(std::chrono::milliseconds time) {
        const auto over = std::chrono::steady_clock::now() + time;
        while (std::chrono::steady_clock::now() < over) std::this_thread::yield();
    }
    MediaTime now() { return world_->clock().captureClock()->now(); }

    const std::unique_ptr<CaptureWorld> world_ = GetParam()();
};

}  // namespace lumacast::test
