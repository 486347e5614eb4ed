// The life of a tap on real threads: its queue calls back on a thread of its own, while the tap is started, stopped,
// replaced and abandoned on others. What is asserted holds anyhow; a race is for the thread sanitizer to find.

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <functional>
#include <optional>
#include <thread>

#include "capture/LCCaptureManager.h"
#include "support/ThreadScheduler.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

constexpr ProcessID kPlayer{500}, kEditor{501};
constexpr std::uint8_t kPlayerTone = 0x11, kEditorTone = 0x22;

HostTime steadyNow() {
    return {std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::steady_clock::now().time_since_epoch())
                .count()};
}

class TapThreads : public ::testing::Test {
protected:
    TapThreads() {
        fakes_->audioInputQueues.play(kPlayer, kPlayerTone);
        fakes_->audioInputQueues.play(kEditor, kEditorTone);
        fakes_->clock.startCaptureClock();
        fakes_->clock.captureClock()->run();
        sound_ = std::thread([this] {
            while (!over_) {
                fakes_->audioInputQueues.hear(882);
                ++heard_;
                std::this_thread::yield();
            }
        });
    }
    ~TapThreads() override {
        endSound();
        manager_.reset();
        scheduler_.reset();  // what is under way ends before the fakes go
    }

    void endSound() {
        over_ = true;
        if (sound_.joinable()) sound_.join();
    }
    static bool waitFor(const std::function<bool()>& condition) {
        const auto limit = std::chrono::steady_clock::now() + std::chrono::seconds(60);
        while (!condition()) {
            if (std::chrono::steady_clock::now() > limit) return false;
            std::this_thread::yield();
        }
        return true;
    }
    void screenHasBegun() { manager_->setCaptureStartTime(MediaTime::make(0, CaptureClock::kTimescale)); }
    /// Until whatever was on its way to the audio capture queue has come.
    void letSoundPass() {
        const std::uint64_t before = heard_;
        EXPECT_TRUE(waitFor([&] { return heard_ > before + 30; }));
        for (const auto& queue : fakes_->audioInputQueues.queues()) queue->lane().sync([] {});
        manager_->audioDispatchQueue()->sync([] {});
    }
    /// Waits for it: whoever plays the sound has a hold on each queue that it lets hear, however long that takes it.
    bool noQueueIsLeft() {
        return waitFor([this] { return fakes_->audioInputQueues.queues().empty(); });
    }
    /// Takes buffers that hold nothing but this tone.
    LCCaptureManager::SampleHandler take(std::uint8_t tone) {
        return [this, tone](const SampleRef& sample) {
            const Data& bytes = *sample->data();
            if (!std::all_of(bytes.begin(), bytes.end(), [&](std::uint8_t byte) { return byte == tone; })) ++strange_;
            if (!manager_->audioDispatchQueue()->isCurrent()) ++strange_;
            if (mayNotHear_) ++strange_;
            ++taken_;
        };
    }

    LCCaptureManager::SampleHandler takeButNot(std::uint8_t tone) {
        return [this, tone](const SampleRef& sample) {
            const Data& bytes = *sample->data();
            if (std::find(bytes.begin(), bytes.end(), tone) != bytes.end()) ++strange_;
            ++taken_;
        };
    }

    std::optional<ThreadScheduler> scheduler_{std::in_place, std::make_shared<ThreadLoop>()};
    const std::unique_ptr<FakePlatform> fakes_ = std::make_unique<FakePlatform>(*scheduler_, steadyNow);
    std::shared_ptr<LCCaptureManager> manager_ = LCCaptureManager::init(fakes_->platform());
    std::thread sound_;
    std::atomic<bool> over_{false}, mayNotHear_{false};
    std::atomic<std::uint64_t> heard_{0}, taken_{0}, strange_{0};
    std::atomic<int> didStart_{0};
};

TEST_F(TapThreads, NoBufferComesAfterAStopHasReturned) {
    for (int round = 1; round <= 100; ++round) {
        mayNotHear_ = false;
        screenHasBegun();
        manager_->startAppAudioCaptureForProcessID(kPlayer, take(kPlayerTone), [this] { ++didStart_; });
        const std::uint64_t before = taken_;
        ASSERT_TRUE(waitFor([&] { return taken_ > before + 12 && didStart_ == round; })) << round;
        if (round % 2 == 0)
            manager_->stopAllCapture();
        else
            manager_->stopAppAudioCapture();
        mayNotHear_ = true;
    }
    letSoundPass();
    EXPECT_EQ(strange_, 0u);
    EXPECT_TRUE(noQueueIsLeft());
}

TEST_F(TapThreads, AReplacedTapIsNotHeardAnyMoreAndEnds) {
    screenHasBegun();
    for (int round = 0; round < 50; ++round) {
        manager_->startAppAudioCaptureForProcessID(kPlayer, takeButNot(kEditorTone), {});
        std::uint64_t before = taken_;
        ASSERT_TRUE(waitFor([&] { return taken_ > before + 3; })) << round;
        // A resume counts from the call on: the silence of its gap may still go to the handler before.
        manager_->resumeAppAudioCaptureForProcessID(kEditor, takeButNot(kPlayerTone));
        manager_->audioDispatchQueue()->sync([] {});
        before = taken_;
        ASSERT_TRUE(waitFor([&] { return taken_ > before + 3; })) << round;
    }
    manager_->stopAllCapture();
    letSoundPass();
    EXPECT_EQ(strange_, 0u);
    EXPECT_TRUE(noQueueIsLeft());
}

TEST_F(TapThreads, WithoutAStartTimeATapStallsForGoodAndTheNextOneRuns) {
    for (int round = 0; round < 20; ++round) {
        manager_->setCaptureStartTime(kInvalidMediaTime);
        manager_->startAppAudioCaptureForProcessID(kPlayer, take(kPlayerTone), {});
        manager_->audioDispatchQueue()->sync([] {});
        const auto tap = manager_->audioRecorderQueue();
        ASSERT_TRUE(tap);
        ASSERT_TRUE(waitFor([&] { return tap->buffersInRotation == 0; })) << round;
        const std::uint64_t before = taken_;
        screenHasBegun();
        letSoundPass();
        EXPECT_EQ(taken_, before);
        manager_->stopAppAudioCapture();
        manager_->startAppAudioCaptureForProcessID(kPlayer, take(kPlayerTone), {});
        ASSERT_TRUE(waitFor([&] { return taken_ > before; })) << round;
        manager_->stopAppAudioCapture();
    }
    EXPECT_EQ(strange_, 0u);
}

TEST_F(TapThreads, StopsFromEverywhereMeetWithoutHarm) {
    screenHasBegun();
    for (int round = 0; round < 50; ++round) {
        manager_->startAppAudioCaptureForProcessID(
            kPlayer,
            [this](const SampleRef&) {
                ++taken_;
                manager_->stopAppAudioCapture();  // from within a buffer
            },
            [this] { manager_->audioRecorderQueue(); });
        std::thread other([this] { manager_->stopAppAudioCapture(); });
        manager_->resumeAppAudioCaptureForProcessID(kEditor, take(kEditorTone));
        manager_->stopAllCapture();
        other.join();
        screenHasBegun();
    }
    manager_->stopAllCapture();
    EXPECT_FALSE(manager_->audioRecorderQueue());
    letSoundPass();
    EXPECT_TRUE(noQueueIsLeft());
}

TEST_F(TapThreads, TheManagerMayGoWhileItsTapIsRunning) {
    for (int round = 0; round < 30; ++round) {
        auto manager = LCCaptureManager::init(fakes_->platform());
        manager->setCaptureStartTime(MediaTime::make(0, CaptureClock::kTimescale));
        // A buffer that is on its way when the manager goes may still come.
        const auto taken = std::make_shared<std::atomic<std::uint64_t>>(0);
        manager->startAppAudioCaptureForProcessID(kPlayer, [taken](const SampleRef&) { ++*taken; }, {});
        ASSERT_TRUE(waitFor([&] { return *taken > 0; })) << round;
        manager.reset();
    }
    EXPECT_TRUE(noQueueIsLeft()) << "a tap is left";
}

}  // namespace
}  // namespace lumacast
