#pragma once
// Audio queues on the fake and on a private sound server, with a process that plays and one that does not.

#include <unistd.h>

#include <chrono>
#include <functional>
#include <future>
#include <memory>
#include <thread>
#include <vector>

#include "headless/sound/ToneTaps.h"
#include "linux/audio/LinuxAudioInputQueues.h"
#include "linux/audio/PulseTaps.h"
#include "linux/system/LinuxClock.h"
#include "support/ThreadScheduler.h"
#include "tests/fakes/FakeAudioInputQueue.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/ThreadLoop.h"
#include "tests/sound/PrivateSoundServer.h"

namespace lumacast::test {

class SoundWorld {
public:
    virtual ~SoundWorld() = default;
    virtual AudioInputQueues& queues() = 0;
    virtual Clock& clock() = 0;
    virtual ProcessID playing() = 0;
    virtual ProcessID quiet() = 0;
    /// Lets a moment pass, in which what is played is heard: at most 20 ms.
    virtual void passTime() = 0;

    bool eventually(const std::function<bool()>& condition) {
        const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(20);
        while (!condition()) {
            if (std::chrono::steady_clock::now() > end) return false;
            passTime();
        }
        return true;
    }
    /// Lets `seconds` of sound pass, on the world's host time.
    void pass(double seconds) {
        const std::int64_t end = clock().hostTime().nanoseconds + static_cast<std::int64_t>(seconds * 1e9);
        while (clock().hostTime().nanoseconds < end) passTime();
    }
};

class FakeSoundWorld final : public SoundWorld {
public:
    FakeSoundWorld() { queues_.play(playing(), 1); }
    AudioInputQueues& queues() override { return queues_; }
    Clock& clock() override { return clock_; }
    ProcessID playing() override { return ProcessID{7}; }
    ProcessID quiet() override { return ProcessID{8}; }
    void passTime() override {
        clock_.advance(std::chrono::milliseconds(20));
        queues_.hear(882);
        // Until the lanes have done what they had to do, as they would in 20 ms; a callback that waits for the test ends that.
        std::vector<std::future<void>> ends;
        for (const auto& queue : queues_.queues()) {
            const auto end = std::make_shared<std::promise<void>>();
            ends.push_back(end->get_future());
            queue->lane().async([end] { end->set_value(); });
        }
        for (const auto& end : ends) end.wait_for(std::chrono::milliseconds(100));
    }

private:
    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
    FakeClock clock_;
    FaultPlan faults_;
    FakeAudioInputQueues queues_{scheduler_, clock_, faults_};
};

/// Tones of the headless port, where this process alone is an application's; the quiet one is its parent.
class HeadlessSoundWorld final : public SoundWorld {
public:
    AudioInputQueues& queues() override { return queues_; }
    Clock& clock() override { return clock_; }
    ProcessID playing() override { return ProcessID{::getpid()}; }
    ProcessID quiet() override { return ProcessID{::getppid()}; }
    void passTime() override { std::this_thread::sleep_for(std::chrono::milliseconds(2)); }

private:
    LinuxClock clock_;
    LinuxAudioInputQueues queues_{
        std::make_shared<headless::ToneTaps>(headless::Show(clock_.hostTime()),
                                             [](ProcessID pid) -> std::optional<BundleIdentifier> {
                                                 if (number(pid) != ::getpid()) return std::nullopt;
                                                 return BundleIdentifier("org.example.Player");
                                             }),
        clock_};
};

/// PulseAudio, with a tone that is played by a process of its own; the quiet process is this one. The server is there
/// from when somebody asks who plays.
class PortSoundWorld final : public SoundWorld {
public:
    AudioInputQueues& queues() override { return queues_; }
    Clock& clock() override { return clock_; }
    ProcessID playing() override {
        if (!player_) {
            server_.start();
            player_ = std::make_unique<TonePlayer>(server_.address());
            player_->tell("play a 997 0.5 2");
        }
        return player_->pid();
    }
    ProcessID quiet() override { return ProcessID{::getpid()}; }
    void passTime() override { std::this_thread::sleep_for(std::chrono::milliseconds(2)); }

private:
    static std::shared_ptr<sound::TapSource> connectTo(const std::string& address) {
        sound::PulseConnection::Options options;
        options.server = address;
        return std::make_shared<sound::PulseTaps>(std::make_shared<sound::PulseConnection>(options), nullptr);
    }

    PrivateSoundServer server_{PrivateSoundServer::Begin::Later};
    std::unique_ptr<TonePlayer> player_;
    LinuxClock clock_;
    LinuxAudioInputQueues queues_{connectTo(server_.address()), clock_};
};

}  // namespace lumacast::test
