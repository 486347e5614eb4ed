#pragma once
// The capture manager in a simulation, with taps and a microphone that the test decides on.

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include "capture/LCCaptureManager.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {

class CaptureWorld : public ::testing::Test {
protected:
    static constexpr ProcessID kPlayer{500};
    using Lines = std::vector<std::string>;

    CaptureWorld() {
        fakes_.log.setVerbose(true);
        fakes_.clock.startCaptureClock();
        fakes_.clock.captureClock()->run();
    }
    ~CaptureWorld() override { world_.scheduler.endWorld(); }

    void settle() { world_.scheduler.runUntilIdle(); }
    void advance(std::chrono::nanoseconds duration) { world_.scheduler.advance(duration); }
    LCCaptureManager::SampleHandler keep() {
        return [this](const SampleRef& sample) {
            onCaptureQueue_ &= manager_->audioDispatchQueue()->isCurrent();
            samples_.push_back(sample);
        };
    }
    /// Starts a tap, up to its running.
    void start(ProcessID pid = kPlayer) {
        manager_->startAppAudioCaptureForProcessID(pid, keep(), [this] { ++didStart_; });
        settle();
    }
    void resume(ProcessID pid = kPlayer) {
        manager_->resumeAppAudioCaptureForProcessID(pid, keep());
        settle();
    }
    /// The first screen frame has come.
    void screenHasBegun() { manager_->setCaptureStartTime(MediaTime::make(0, CaptureClock::kTimescale)); }
    std::shared_ptr<FakeAudioInputQueue> queue() { return fakes_.audioInputQueues.lastQueue(); }
    /// A buffer of `bytes` bytes from the tap.
    bool hear(std::size_t bytes = 1764, std::uint64_t at = 0, std::uint8_t value = 7) {
        const bool delivered = queue() && queue()->deliver(Data(bytes, value), at);
        settle();
        return delivered;
    }
    std::size_t logged(std::string_view text) { return fakes_.logSink.count(text); }

    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    const std::shared_ptr<LCCaptureManager> manager_ = LCCaptureManager::init(fakes_.platform());
    std::vector<SampleRef> samples_;
    int didStart_ = 0;
    bool onCaptureQueue_ = true;
};

}  // namespace lumacast
