#pragma once
// What the suites of device capture share: who listens, and a real sound server with a microphone.

#include <algorithm>
#include <bit>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <map>
#include <memory>
#include <mutex>
#include <span>
#include <string>
#include <thread>
#include <vector>

#include "linux/audio/DeviceSamples.h"
#include "linux/audio/LinuxDeviceCapture.h"
#include "linux/audio/PulseTaps.h"
#include "linux/system/LinuxClock.h"
#include "platform/DeviceCapture.h"
#include "support/ThreadScheduler.h"
#include "tests/checkers/ToneChecker.h"
#include "tests/contract/MediaWorld.h"
#include "tests/contract/PipedMicrophone.h"
#include "tests/fakes/ThreadLoop.h"
#include "tests/sound/PrivateSoundServer.h"

namespace lumacast::testing {

/// Keeps what an output delivers.
class SampleListener final : public CaptureOutputDelegate {
public:
    explicit SampleListener(std::shared_ptr<SerialQueue> queue) : queue_(std::move(queue)) {}

    void captureOutputDidOutputSampleBuffer(const std::shared_ptr<CaptureOutput>& output,
                                            const SampleRef& sample) override {
        const std::lock_guard lock(mutex_);
        isElsewhere_ = isElsewhere_ || !queue_->isCurrent();
        isOfAnother_ = isOfAnother_ || (output_ && output_ != output.get());
        output_ = output.get();
        samples_.push_back(sample);
        const auto data = sample->data();
        for (std::size_t byte = 0; data && byte + 1 < data->size(); byte += 2) {
            const auto word = static_cast<std::uint16_t>((*data)[byte] << 8 | (*data)[byte + 1]);
            sound_.push_back(static_cast<float>(std::bit_cast<std::int16_t>(word)) / 32768.0f);
        }
    }

    std::size_t count() const {
        const std::lock_guard lock(mutex_);
        return samples_.size();
    }
    /// How much sound came.
    double seconds() const {
        const std::lock_guard lock(mutex_);
        return static_cast<double>(sound_.size()) / 44100;
    }
    std::vector<SampleRef> samples() const {
        const std::lock_guard lock(mutex_);
        return samples_;
    }
    /// The level of a tone in the last quarter of a second; -200 when there is not so much yet.
    double level(double frequency) const {
        constexpr std::size_t kFrames = 11025;
        const std::lock_guard lock(mutex_);
        if (sound_.size() < kFrames) return -200;
        return checkers::toneLevel(std::span(sound_).last(kFrames), 44100, frequency);
    }
    std::vector<float> sound() const {
        const std::lock_guard lock(mutex_);
        return sound_;
    }
    /// Whether all of them came on the queue, and from one output.
    bool cameOnItsQueue() const {
        const std::lock_guard lock(mutex_);
        return !isElsewhere_;
    }
    bool cameFrom(const std::shared_ptr<CaptureOutput>& output) const {
        const std::lock_guard lock(mutex_);
        return !isOfAnother_ && output_ == output.get();
    }

private:
    const std::shared_ptr<SerialQueue> queue_;
    mutable std::mutex mutex_;
    std::vector<SampleRef> samples_;
    std::vector<float> sound_;
    const CaptureOutput* output_ = nullptr;
    bool isElsewhere_ = false, isOfAnother_ = false;
};

/// A session with an input, and an output that is listened to. It may be started at once.
struct ListenedSession {
    ListenedSession(DeviceCapture& devices, Scheduler& scheduler, bool usesAudioSession = true)
        : queue(scheduler.serialQueue("samples")),
          listener(std::make_shared<SampleListener>(queue)),
          session(devices.makeSession()),
          input(devices.defaultAudioInput()),
          output(devices.makeAudioDataOutput()) {
        session->setUsesApplicationAudioSession(usesAudioSession);
        session->setAutomaticallyConfiguresApplicationAudioSession(false);
        output->setSampleBufferDelegate(listener, queue);
        session->addInput(input);
        session->addOutput(output);
    }
    /// Waits for what was submitted to the queue.
    void drain() const {
        queue->sync([] {});
    }

    const std::shared_ptr<SerialQueue> queue;
    const std::shared_ptr<SampleListener> listener;
    std::shared_ptr<DeviceCaptureSession> session;
    const std::shared_ptr<CaptureInput> input;
    const std::shared_ptr<CaptureOutput> output;
};

/// The interruptions that were told, in order.
class Interruptions final {
public:
    explicit Interruptions(AudioSession& session)
        : state_(std::make_shared<State>()),
          registration_(session.observeInterruptions([state = state_](std::uint64_t type) {
              const std::lock_guard lock(state->mutex);
              state->types.push_back(type);
          })) {}

    std::vector<std::uint64_t> types() const {
        const std::lock_guard lock(state_->mutex);
        return state_->types;
    }
    std::size_t count() const { return types().size(); }
    void end() { registration_.reset(); }

private:
    struct State {
        std::mutex mutex;
        std::vector<std::uint64_t> types;
    };
    const std::shared_ptr<State> state_;
    std::unique_ptr<AudioSession::Registration> registration_;
};

/// A sound server of the test's own, and the port's role at it.
class SoundServerWorld final {
public:
    explicit SoundServerWorld(std::unique_ptr<test::SoundServer> soundServer)
        : server_(std::move(soundServer)), connection_(connectTo(server_->address())) {
        clock_.startCaptureClock();
        clock_.captureClock()->run();
    }
    ~SoundServerWorld() { connection_->end(); }
    SoundServerWorld(const SoundServerWorld&) = delete;
    SoundServerWorld& operator=(const SoundServerWorld&) = delete;

    test::SoundServer& server() { return *server_; }
    sound::PulseConnection& connection() { return *connection_; }
    LinuxDeviceCapture& devices() { return devices_; }
    LinuxClock& clock() { return clock_; }
    ThreadScheduler& scheduler() { return scheduler_; }

    /// What the server's tool answers to a command; nothing when it failed.
    std::string control(const std::string& command) const {
        const std::string line =
            "env -u DISPLAY PULSE_SERVER='" + server_->address() + "' LC_ALL=C pactl " + command;
        std::string answer;
        FILE* const pipe = ::popen(line.c_str(), "r");
        if (!pipe) return {};
        char buffer[512];
        while (const std::size_t length = std::fread(buffer, 1, sizeof buffer, pipe)) answer.append(buffer, length);
        return ::pclose(pipe) == 0 ? answer : "";
    }
    bool does(const std::string& command) const { return !control(command + " && echo done").empty(); }
    /// A microphone in a room of its own, in which nothing is heard at first; it becomes the default. Null when that
    /// failed. After a restart of the server it can be added again.
    PipedMicrophone* addMicrophone(const std::string& name) {
        auto& room = rooms_[name];
        const std::string pipe = directory_.path(name);
        if (!room) room = std::make_unique<PipedMicrophone>();
        std::filesystem::remove(pipe);
        const bool isThere = does("load-module module-pipe-source source_name=" + name + " file=" + pipe +
                                  " format=s16le rate=" + std::to_string(PipedMicrophone::kRate) +
                                  " channels=" + std::to_string(PipedMicrophone::kChannels)) &&
                             choose(name);
        if (!isThere) return nullptr;
        room->connect(pipe);
        return room.get();
    }
    bool choose(const std::string& source) const { return does("set-default-source " + source); }
    /// An application that plays a tone.
    std::unique_ptr<test::TonePlayer> play(int frequency) const {
        auto player = std::make_unique<test::TonePlayer>(server_->address());
        if (!player->isReady() || !player->tell("play tone " + std::to_string(frequency) + " 0.5 2")) return nullptr;
        return player;
    }
    /// A call that records from the microphone, for as long as the object lives.
    std::unique_ptr<test::SoundProcess> call(const std::string& microphone, const std::string& role = "phone") const {
        return std::make_unique<test::SoundProcess>(
            std::vector<std::string>{"parec", "-d", microphone, "--property=media.role=" + role, "/dev/null"},
            std::vector<std::string>{"PULSE_SERVER=" + server_->address(), "DISPLAY"});
    }
    static constexpr const char* kOurs = "media.name = \"microphone\"";
    static constexpr const char* kCalls = "application.name = \"parec\"";
    /// How many streams with this property record now, by the server's account.
    std::size_t recordings(const std::string& line = kOurs) const {
        const std::string list = control("list source-outputs");
        std::size_t count = 0;
        for (std::size_t at = list.find(line); at != std::string::npos; at = list.find(line, at + 1)) ++count;
        return count;
    }

private:
    static std::shared_ptr<sound::PulseConnection> connectTo(const std::string& address) {
        sound::PulseConnection::Options options;
        options.server = address;
        return std::make_shared<sound::PulseConnection>(options);
    }

    const std::unique_ptr<test::SoundServer> server_;
    const ScratchDirectory directory_;
    std::map<std::string, std::unique_ptr<PipedMicrophone>> rooms_;
    LinuxClock clock_;
    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
    const std::shared_ptr<sound::PulseConnection> connection_;
    LinuxDeviceCapture devices_{sound::pulseMicrophone(connection_), clock_, scheduler_};
};

}  // namespace lumacast::testing
