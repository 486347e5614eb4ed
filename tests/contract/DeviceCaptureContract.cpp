#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <set>

#include "headless/sound/SyntheticMicrophone.h"
#include "tests/contract/DeviceCaptureWorld.h"
#include "tests/fakes/FakeDeviceCapture.h"

namespace lumacast {
namespace {

using testing::Interruptions;
using testing::ListenedSession;
using testing::SampleListener;

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
    testing::SoundServerWorld world_{std::make_unique<test::PrivateSoundServer>()};
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

class ForeignInput final : public CaptureInput {};
class ForeignOutput final : public CaptureOutput {
public:
    void setSampleBufferDelegate(std::weak_ptr<CaptureOutputDelegate>, std::shared_ptr<SerialQueue>) override {}
};

using Maker = std::function<std::unique_ptr<DeviceCaptureWorld>()>;

class DeviceCaptureContract : public ::testing::TestWithParam<Maker> {
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

TEST_P(DeviceCaptureContract, ASessionRunsOnceItIsStartedAndUntilItIsStopped) {
    const auto session = devices_.makeSession();
    ASSERT_TRUE(session);
    EXPECT_FALSE(session->isRunning());
    session->startRunning();
    EXPECT_TRUE(eventually([&] { return session->isRunning(); }));
    session->stopRunning();
    EXPECT_TRUE(eventually([&] { return !session->isRunning(); }));
}

TEST_P(DeviceCaptureContract, ObserversOfRunningAreToldOfEachChangeAndNeverInline) {
    const auto session = devices_.makeSession();
    const auto observer = std::make_shared<Observer>();
    session->addObserver(observer, DeviceCaptureSession::kRunning);
    session->startRunning();
    session->startRunning();  // no change
    ASSERT_TRUE(observer->wasTold(1));
    EXPECT_TRUE(session->isRunning());
    session->stopRunning();
    session->stopRunning();
    ASSERT_TRUE(observer->wasTold(2));
    session->startRunning();
    ASSERT_TRUE(observer->wasTold(3));
    EXPECT_EQ(observer->told(), std::vector<std::string>(3, "running"));
    EXPECT_FALSE(observer->wasToldOn(std::this_thread::get_id()));
}

TEST_P(DeviceCaptureContract, OnlyThePairOfKeyPathAndObserverThatIsThereCanBeRemoved) {
    const auto session = devices_.makeSession();
    const auto observer = std::make_shared<Observer>(), other = std::make_shared<Observer>();
    session->addObserver(observer, DeviceCaptureSession::kRunning);
    EXPECT_FALSE(session->removeObserver(observer.get(), "isRunning"));
    EXPECT_FALSE(session->removeObserver(other.get(), DeviceCaptureSession::kRunning));
    session->startRunning();
    EXPECT_TRUE(observer->wasTold(1)) << "still there";
    EXPECT_TRUE(session->removeObserver(observer.get(), DeviceCaptureSession::kRunning));
    EXPECT_FALSE(session->removeObserver(observer.get(), DeviceCaptureSession::kRunning));
    session->addObserver(other, DeviceCaptureSession::kRunning);
    session->stopRunning();
    ASSERT_TRUE(other->wasTold(1));
    EXPECT_EQ(observer->told().size(), 1u);
}

TEST_P(DeviceCaptureContract, AKeyPathThatNamesNothingCanBeObservedAndNeverChanges) {
    const auto session = devices_.makeSession();
    const auto observer = std::make_shared<Observer>(), witness = std::make_shared<Observer>();
    session->addObserver(observer, "isRunning");
    session->addObserver(witness, DeviceCaptureSession::kRunning);
    session->startRunning();
    ASSERT_TRUE(witness->wasTold(1));
    EXPECT_TRUE(observer->told().empty());
    EXPECT_TRUE(session->removeObserver(observer.get(), "isRunning"));
}

TEST_P(DeviceCaptureContract, APairAddedTwiceIsRemovedOnceAtATime) {
    const auto session = devices_.makeSession();
    const auto observer = std::make_shared<Observer>();
    session->addObserver(observer, DeviceCaptureSession::kRunning);
    session->addObserver(observer, DeviceCaptureSession::kRunning);
    EXPECT_TRUE(session->removeObserver(observer.get(), DeviceCaptureSession::kRunning));
    session->startRunning();
    EXPECT_TRUE(observer->wasTold(1));
    EXPECT_TRUE(session->removeObserver(observer.get(), DeviceCaptureSession::kRunning));
    EXPECT_FALSE(session->removeObserver(observer.get(), DeviceCaptureSession::kRunning));
}

TEST_P(DeviceCaptureContract, ObserversAreHeldWeakly) {
    const auto session = devices_.makeSession();
    auto observer = std::make_shared<Observer>();
    const std::weak_ptr<Observer> weak = observer;
    const auto* const key = observer.get();
    session->addObserver(observer, DeviceCaptureSession::kRunning);
    observer.reset();
    EXPECT_TRUE(weak.expired());
    EXPECT_FALSE(session->removeObserver(key, DeviceCaptureSession::kRunning));
    const auto witness = std::make_shared<Observer>();
    session->addObserver(witness, DeviceCaptureSession::kRunning);
    session->startRunning();
    EXPECT_TRUE(witness->wasTold(1));
}

TEST_P(DeviceCaptureContract, ASessionTakesOneInputOfItsOwnPlatform) {
    const auto session = devices_.makeSession();
    const auto input = devices_.defaultAudioInput(), second = devices_.defaultAudioInput();
    ASSERT_TRUE(input);
    EXPECT_FALSE(session->canAddInput(nullptr));
    EXPECT_FALSE(session->canAddInput(std::make_shared<ForeignInput>()));
    EXPECT_TRUE(session->canAddInput(input));
    session->addInput(input);
    EXPECT_FALSE(session->canAddInput(input)) << "here already";
    EXPECT_FALSE(session->canAddInput(second)) << "one of its kind";
    session->addInput(second);  // refused
    session->removeInput(second);
    session->removeInput(nullptr);
    EXPECT_FALSE(session->canAddInput(second));
    session->removeInput(input);
    EXPECT_TRUE(session->canAddInput(second));
    session->removeInput(input);
    EXPECT_TRUE(session->canAddInput(input));
}

TEST_P(DeviceCaptureContract, ASessionTakesOneOutputOfItsOwnPlatform) {
    const auto session = devices_.makeSession();
    const auto output = devices_.makeAudioDataOutput(), second = devices_.makeAudioDataOutput();
    ASSERT_TRUE(output);
    EXPECT_FALSE(session->canAddOutput(nullptr));
    EXPECT_FALSE(session->canAddOutput(std::make_shared<ForeignOutput>()));
    EXPECT_TRUE(session->canAddOutput(output));
    session->addOutput(output);
    EXPECT_FALSE(session->canAddOutput(output)) << "here already";
    EXPECT_FALSE(session->canAddOutput(second)) << "one of its kind";
    session->addOutput(second);  // refused
    session->removeOutput(second);
    session->removeOutput(nullptr);
    EXPECT_FALSE(session->canAddOutput(second));
    session->removeOutput(output);
    EXPECT_TRUE(session->canAddOutput(second));
}

TEST_P(DeviceCaptureContract, SamplesComeOnTheOutputsQueueInTheDescribedFormat) {
    const auto listened = listen();
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened, 10));
    EXPECT_TRUE(listened.listener->cameOnItsQueue());
    EXPECT_TRUE(listened.listener->cameFrom(listened.output));
    AudioFormat expected;
    expected.sampleRate = 44100;
    expected.formatID = fourCC("lpcm");
    expected.formatFlags = 14;  // signed, packed, big-endian
    expected.bytesPerPacket = expected.bytesPerFrame = 2;
    expected.framesPerPacket = expected.channelsPerFrame = 1;
    expected.bitsPerChannel = 16;
    for (const SampleRef& sample : listened.listener->samples()) {
        ASSERT_EQ(sample->format().type, MediaType::Audio);
        ASSERT_EQ(sample->format().audio, expected);
        ASSERT_GT(sample->sampleCount(), 0);
        ASSERT_EQ(sample->data()->size(), static_cast<std::size_t>(sample->sampleCount()) * 2);
        ASSERT_EQ(compare(sample->duration(), MediaTime::make(sample->sampleCount(), 44100)), 0);
        ASSERT_EQ(sample->presentationTime().timescale, CaptureClock::kTimescale);
    }
}

TEST_P(DeviceCaptureContract, NoSampleBeginsBeforeTheOneBeforeItEnds) {
    const auto listened = listen();
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened, 20));
    const auto samples = listened.listener->samples();
    for (std::size_t next = 1; next < samples.size(); ++next) {
        const double end = samples[next - 1]->presentationTime().seconds() + samples[next - 1]->duration().seconds();
        EXPECT_GE(samples[next]->presentationTime().seconds() - end, -1.0 / 44100) << next;
    }
}

TEST_P(DeviceCaptureContract, NothingComesBeforeTheStartNorAfterTheStop) {
    const auto listened = listen();
    EXPECT_TRUE(hearsNothing(listened));
    EXPECT_EQ(listened.listener->count(), 0u);
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    listened.session->stopRunning();
    EXPECT_TRUE(hearsNothing(listened));
    listened.session->startRunning();
    EXPECT_TRUE(hears(listened));
}

TEST_P(DeviceCaptureContract, NothingComesWithoutAnInputWhichMayComeAndGoMeanwhile) {
    const auto listened = listen();
    listened.session->removeInput(listened.input);
    listened.session->startRunning();
    EXPECT_TRUE(hearsNothing(listened));
    EXPECT_TRUE(listened.session->isRunning());
    listened.session->addInput(listened.input);
    EXPECT_TRUE(hears(listened));
    listened.session->removeInput(listened.input);
    EXPECT_TRUE(hearsNothing(listened));
    EXPECT_TRUE(listened.session->isRunning());
}

TEST_P(DeviceCaptureContract, NothingComesFromAnOutputThatWasRemovedUntilItIsBack) {
    const auto listened = listen();
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    listened.session->removeOutput(listened.output);
    EXPECT_TRUE(hearsNothing(listened));
    listened.session->addOutput(listened.output);
    EXPECT_TRUE(hears(listened));
}

TEST_P(DeviceCaptureContract, ADelegateCanBeReplacedAndTakenAway) {
    const auto listened = listen();
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    const auto other = std::make_shared<SampleListener>(listened.queue);
    listened.output->setSampleBufferDelegate(other, listened.queue);
    EXPECT_TRUE(hearsNothing(listened));
    EXPECT_TRUE(eventually([&] {
        world_->hear();
        return other->count() >= 3;
    }));
    listened.output->setSampleBufferDelegate({}, nullptr);
    world_->letSoundPass();
    listened.drain();
    const std::size_t before = other->count();
    world_->letSoundPass();
    listened.drain();
    EXPECT_EQ(other->count(), before);
}

TEST_P(DeviceCaptureContract, DelegatesAreHeldWeakly) {
    const auto listened = listen();
    auto other = std::make_shared<SampleListener>(listened.queue);
    const std::weak_ptr<SampleListener> weak = other;
    listened.output->setSampleBufferDelegate(other, listened.queue);
    listened.session->startRunning();
    ASSERT_TRUE(eventually([&] {
        world_->hear();
        return other->count() >= 3;
    }));
    other.reset();
    EXPECT_TRUE(eventually([&] { return weak.expired(); }));
    world_->letSoundPass();
    listened.drain();
}

TEST_P(DeviceCaptureContract, DestroyingASessionStopsIt) {
    auto listened = listen();
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    listened.session.reset();
    EXPECT_TRUE(hearsNothing(listened));
}

TEST_P(DeviceCaptureContract, ASuspendedMicrophoneIsAnInterruptionUntilItIsHeardAgain) {
    const auto listened = listen();
    const Interruptions interruptions(devices_.sharedAudioSession());
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    EXPECT_EQ(interruptions.count(), 0u);
    world_->setSuspended(true);
    ASSERT_TRUE(eventually([&] { return interruptions.count() >= 1; }));
    EXPECT_TRUE(listened.session->isRunning());
    world_->setSuspended(false);
    ASSERT_TRUE(hears(listened));
    ASSERT_TRUE(eventually([&] { return interruptions.count() >= 2; }));
    EXPECT_EQ(interruptions.types(),
              (std::vector{AudioSession::kInterruptionBegan, AudioSession::kInterruptionEnded}));
}

TEST_P(DeviceCaptureContract, ACallTakesTheMicrophoneUntilItIsOver) {
    const auto listened = listen();
    const Interruptions interruptions(devices_.sharedAudioSession());
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    world_->setTakenByACall(true);
    ASSERT_TRUE(eventually([&] { return interruptions.count() >= 1; }));
    listened.drain();
    const std::size_t before = listened.listener->count();
    world_->hear();
    listened.drain();
    EXPECT_EQ(listened.listener->count(), before) << "nothing while it is taken";
    world_->setTakenByACall(false);
    ASSERT_TRUE(hears(listened));
    ASSERT_TRUE(eventually([&] { return interruptions.count() >= 2; }));
    EXPECT_EQ(interruptions.types(),
              (std::vector{AudioSession::kInterruptionBegan, AudioSession::kInterruptionEnded}));
}

TEST_P(DeviceCaptureContract, WhoNoLongerObservesInterruptionsIsNotTold) {
    const auto listened = listen();
    Interruptions gone(devices_.sharedAudioSession());
    const Interruptions stays(devices_.sharedAudioSession());
    listened.session->startRunning();
    ASSERT_TRUE(hears(listened));
    gone.end();
    world_->setSuspended(true);
    ASSERT_TRUE(eventually([&] { return stays.count() == 1; }));
    EXPECT_EQ(gone.count(), 0u);
}

TEST_P(DeviceCaptureContract, OnlyKnownCategoriesAndOptionsAreAccepted) {
    AudioSession& session = devices_.sharedAudioSession();
    EXPECT_TRUE(session.setCategory(AudioSession::kPlayAndRecord,
                                    AudioSession::kMixWithOthers | AudioSession::kAllowBluetoothHandsFree));
    EXPECT_TRUE(session.setCategory(AudioSession::kPlayAndRecord, 0));
    EXPECT_FALSE(session.setCategory("PlayAndSing", 0));
    EXPECT_FALSE(session.setCategory("", 0));
    EXPECT_FALSE(session.setCategory(AudioSession::kPlayAndRecord, 2));
}

INSTANTIATE_TEST_SUITE_P(Fake, DeviceCaptureContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeDeviceCaptureWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, DeviceCaptureContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortDeviceCaptureWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Headless, DeviceCaptureContract,
                         ::testing::Values(Maker([] { return std::make_unique<HeadlessDeviceCaptureWorld>(); })));

}  // namespace
}  // namespace lumacast
