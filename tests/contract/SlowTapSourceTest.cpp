// A queue whose source has to look for the process it is to tap, on a disk that may be slow.

#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>
#include <functional>
#include <future>
#include <memory>
#include <thread>
#include <utility>

#include "linux/audio/LinuxAudioInputQueues.h"
#include "linux/system/LinuxClock.h"
#include "tests/contract/HeardSound.h"

namespace lumacast {
namespace {

/// Finds a process that plays nothing, after something else has happened.
class SlowTaps final : public sound::TapSource {
public:
    explicit SlowTaps(const std::function<void()>& meanwhile) : meanwhile_(meanwhile) {}

    std::shared_ptr<sound::TappedProcess> hold(ProcessID) override {
        meanwhile_();
        return std::make_shared<Quiet>();
    }

private:
    class Nothing final : public sound::Listening {};
    class Quiet final : public sound::TappedProcess {
        std::unique_ptr<sound::Listening> listen(std::shared_ptr<sound::TapMix>) override {
            return std::make_unique<Nothing>();
        }
    };
    const std::function<void()>& meanwhile_;
};

class SlowTapSourceTest : public ::testing::Test {
protected:
    std::int32_t setProcessTap() { return queue_->setProcessTap(ProcessID{::getpid()}); }

    LinuxClock clock_;
    std::function<void()> meanwhile_ = [] {};
    LinuxAudioInputQueues queues_{std::make_shared<SlowTaps>(meanwhile_), clock_};
    const std::shared_ptr<AudioInputQueue> queue_ =
        queues_.makeInputQueue(test::recorderFormat(), [](auto&&...) {}, AudioInputQueues::kCaptureProcessOutput).queue;
};

TEST_F(SlowTapSourceTest, NobodyElseWaitsForTheQueueWhileItLooks) {
    std::thread other;
    bool wasAnswered = false;
    meanwhile_ = [&] {
        std::promise<void> answered;
        const auto answer = answered.get_future();
        other = std::thread([this, answered = std::move(answered)]() mutable {
            AudioFormat format;
            EXPECT_EQ(queue_->streamFormat(format), AudioStatus::kSuccess);
            answered.set_value();
        });
        wasAnswered = answer.wait_for(std::chrono::seconds(20)) == std::future_status::ready;
    };
    EXPECT_EQ(setProcessTap(), AudioStatus::kSuccess);
    other.join();
    EXPECT_TRUE(wasAnswered);
}

TEST_F(SlowTapSourceTest, AQueueThatWasStartedMeanwhileTapsNobodyNew) {
    meanwhile_ = [this] { EXPECT_EQ(queue_->start(), AudioStatus::kSuccess); };
    EXPECT_EQ(setProcessTap(), AudioStatus::kBadState);
}

TEST_F(SlowTapSourceTest, AQueueThatWasDisposedOfMeanwhileTapsNobody) {
    meanwhile_ = [this] { EXPECT_EQ(queue_->dispose(), AudioStatus::kSuccess); };
    EXPECT_EQ(setProcessTap(), AudioStatus::kDisposed);
}

TEST_F(SlowTapSourceTest, AQueueThatIsGoneAsksNoSource) {
    meanwhile_ = [] { ADD_FAILURE() << "the source was asked"; };
    EXPECT_EQ(queue_->start(), AudioStatus::kSuccess);
    EXPECT_EQ(setProcessTap(), AudioStatus::kBadState);
    EXPECT_EQ(queue_->dispose(), AudioStatus::kSuccess);
    EXPECT_EQ(setProcessTap(), AudioStatus::kDisposed);
}

}  // namespace
}  // namespace lumacast
