#pragma once
// A microphone on the fake and on both ports, and who is told of it.

#include <gtest/gtest.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include "headless/sound/SyntheticMicrophone.h"
#include "tests/contract/DeviceCaptureWorld.h"
#include "tests/contract/Eventually.h"
#include "tests/fakes/FakeDeviceCapture.h"

namespace lumacast::testing {

/// A microphone that hears something all the time.
class DeviceCaptureWorld {
public:
    virtual ~DeviceCaptureWorld() = default;
    /// Makes the microphone; whether it is there.
    virtual bool isThere() { return true; }
    virtual DeviceCapture& devices() = 0;
    virtual Scheduler& scheduler() = 0;
    /// A little more is heard, where that needs help.
    virtual void hear() = 0;
    /// Returns when every session that hears the microphone has heard more of it than before.
    virtual void letSoundPass() = 0;
    virtual void setSuspended(bool suspended) = 0;
    virtual void setTakenByACall(bool taken) = 0;
};

class FakeDeviceCaptureWorld final : public DeviceCaptureWorld {
public:
    DeviceCapture& devices() override { return devices_; }
    Scheduler& scheduler() override { return scheduler_; }
    void hear() override {
        if (isSilent_) return;
        const auto session = devices_.lastSession();
        if (!session) return;
        session->deliver(SampleBuffer::makeAudio(
            sound::microphoneFormat(), Data(882, 1), 441,
            {MediaTime::make(441, 44100), MediaTime::make(next_++ * 10'000'000, CaptureClock::kTimescale),
             kInvalidMediaTime}));
    }
    void letSoundPass() override {
        for (int piece = 0; piece < 5; ++piece) hear();
    }
    void setSuspended(bool suspended) override { interrupt(suspended); }
    void setTakenByACall(bool taken) override { interrupt(taken); }

private:
    void interrupt(bool begins) {
        isSilent_ = begins;
        devices_.sharedAudioSession().interrupt(begins ? AudioSession::kInterruptionBegan
                                                       : AudioSession::kInterruptionEnded);
    }

    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
    FakeDeviceCapture devices_{scheduler_};
    bool isSilent_ = false;
    std::int64_t next_ = 0;
};

class PortDeviceCaptureWorld final : public DeviceCaptureWorld {
public:
    bool isThere() override { return world_.server().isThere() && world_.addMicrophone("mic") != nullptr; }
    DeviceCapture& devices() override { return world_.devices(); }
    Scheduler& scheduler() override { return world_.scheduler(); }
    void hear() override {}
    void letSoundPass() override {
        // All sessions are served by one thread: when another one has heard enough, so has everybody.
        const ListenedSession witness(world_.devices(), world_.scheduler(), false);
        witness.session->startRunning();
        ASSERT_TRUE(eventually([&] { return witness.listener->count() >= 5; }));
    }
    void setSuspended(bool suspended) override {
        EXPECT_TRUE(world_.does(std::string("suspend-source mic ") + (suspended ? "1" : "0")));
    }
    void setTakenByACall(bool taken) override {
        call_.reset();
        if (taken) call_ = world_.call("mic");
    }

private:
    SoundServerWorld world_{std::make_unique<test::PrivateSoundServer>()};
    std::unique_ptr<test::SoundProcess> call_;
};

class HeadlessDeviceCaptureWorld final : public DeviceCaptureWorld {
public:
    HeadlessDeviceCaptureWorld() {
        clock_.startCaptureClock();
        clock_.captureClock()->run();
    }
    DeviceCapture& devices() override { return devices_; }
    Scheduler& scheduler() override { return scheduler_; }
    void hear() override {}
    void letSoundPass() override {
        // Every opening has a thread of its own, which hears something each 20 ms.
        const ListenedSession witness(devices_, scheduler_, false);
        witness.session->startRunning();
        ASSERT_TRUE(eventually([&] { return witness.listener->count() >= 5; }));
    }
    void setSuspended(bool suspended) override { setTakenByACall(suspended); }
    void setTakenByACall(bool taken) override { microphone_.setTaken(taken); }

private:
    LinuxClock clock_;
    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
    headless::SyntheticMicrophone microphone_;
    LinuxDeviceCapture devices_{
        [this](sound::MicrophoneListener listener) { return microphone_.open(std::move(listener)); }, clock_, scheduler_};
};

/// Counts what it is told.
class Observer final : public CaptureSessionObserver {
public:
    void observeValueForKeyPath(std::string_view keyPath) override {
        const std::lock_guard lock(mutex_);
        told_.emplace_back(keyPath);
        threads_.insert(std::this_thread::get_id());
    }
    std::vector<std::string> told() const {
        const std::lock_guard lock(mutex_);
        return told_;
    }
    bool wasTold(std::size_t times) const {
        return eventually([&] { return told().size() >= times; });
    }
    bool wasToldOn(std::thread::id thread) const {
        const std::lock_guard lock(mutex_);
        return threads_.count(thread) != 0;
    }

private:
    mutable std::mutex mutex_;
    std::vector<std::string> told_;
    std::set<std::thread::id> threads_;
};

using DeviceCaptureWorldMaker = std::function<std::unique_ptr<DeviceCaptureWorld>()>;

class DeviceCaptureContract : public ::testing::TestWithParam<DeviceCaptureWorldMaker> {
protected:
    void SetUp() override { ASSERT_TRUE(world_->isThere()); }
    ListenedSession listen() { return ListenedSession(devices_, world_->scheduler()); }
    /// Whether so many more samples come.
    bool hears(const ListenedSession& listened, std::size_t more = 3) {
        const std::size_t before = listened.listener->count();
        return eventually([&] {
            world_->hear();
            return listened.listener->count() >= before + more;
        });
    }
    /// Whether no more samples come while sound passes; what was on its way is let through first.
    bool hearsNothing(const ListenedSession& listened) {
        world_->letSoundPass();
        listened.drain();
        const std::size_t before = listened.listener->count();
        world_->letSoundPass();
        listened.drain();
        return listened.listener->count() == before;
    }

    std::unique_ptr<DeviceCaptureWorld> world_ = GetParam()();
    DeviceCapture& devices_ = world_->devices();
};

}  // namespace lumacast::testing
