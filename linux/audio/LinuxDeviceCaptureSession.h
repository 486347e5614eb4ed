#pragma once
#include <cstdint>
#include <memory>
#include <mutex>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "linux/audio/DeviceAudioOutput.h"
#include "linux/audio/DeviceAudioSession.h"
#include "linux/audio/TapSource.h"
#include "platform/Clock.h"
#include "platform/DeviceCapture.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// The default microphone, whichever it is at the time.
class MicrophoneInput final : public CaptureInput {};

/// What a session needs of the port.
struct DeviceServices {
    sound::OpenMicrophone openMicrophone;
    Clock& clock;  ///< asked only at a start
    sound::DeviceAudioSession& audioSession;  ///< asked only while an operation of the session runs
};

/// The microphone is open only while the session runs and has both an input and an output. Thread-safe; samples are
/// made on the microphone's thread, changes are told on a queue of the session.
class LinuxDeviceCaptureSession final : public DeviceCaptureSession,
                                        public std::enable_shared_from_this<LinuxDeviceCaptureSession> {
public:
    LinuxDeviceCaptureSession(DeviceServices services, Scheduler& scheduler);

    /// Both count from when the microphone is opened next. Nothing of the shared audio session has to be changed for a
    /// recording here, so it never is.
    void setUsesApplicationAudioSession(bool uses) override;
    void setAutomaticallyConfiguresApplicationAudioSession(bool /*configures*/) override {}

    bool canAddInput(const std::shared_ptr<CaptureInput>& input) const override;
    void addInput(const std::shared_ptr<CaptureInput>& input) override;
    void removeInput(const std::shared_ptr<CaptureInput>& input) override;
    bool canAddOutput(const std::shared_ptr<CaptureOutput>& output) const override;
    void addOutput(const std::shared_ptr<CaptureOutput>& output) override;
    void removeOutput(const std::shared_ptr<CaptureOutput>& output) override;

    void startRunning() override;
    void stopRunning() override;
    bool isRunning() const override;

    void addObserver(std::weak_ptr<CaptureSessionObserver> observer, std::string_view keyPath) override;
    bool removeObserver(const CaptureSessionObserver* observer, std::string_view keyPath) override;

private:
    struct Observation {
        std::string keyPath;
        const CaptureSessionObserver* key;
        std::weak_ptr<CaptureSessionObserver> observer;
    };
    /// One opening of the microphone.
    struct Opening {
        std::unique_ptr<sound::Listening> microphone;
        std::shared_ptr<sound::DeviceAudioSession::Part> part;
    };

    bool canAddInputLocked(const std::shared_ptr<CaptureInput>& input) const;
    bool canAddOutputLocked(const std::shared_ptr<CaptureOutput>& output) const;
    /// Opens or closes the microphone as things are now. What is closed is answered, to be let go of after the lock.
    [[nodiscard]] Opening updateLocked();
    void openLocked();
    void tellRunning(const std::vector<std::weak_ptr<CaptureSessionObserver>>& observers);
    std::vector<std::weak_ptr<CaptureSessionObserver>> observersOfRunningLocked() const;
    void heard(std::uint64_t number, const sound::SoundTimeline& timeline, std::int64_t first,
               std::span<const float> samples);

    const DeviceServices services_;
    const std::shared_ptr<SerialQueue> lane_;

    mutable std::mutex mutex_;
    bool usesAudioSession_ = true;
    bool running_ = false;
    std::shared_ptr<CaptureClock> clock_;  ///< of the recording in which it was started
    std::shared_ptr<CaptureInput> input_;
    std::shared_ptr<sound::DeviceAudioOutput> output_;
    std::vector<Observation> observations_;
    Opening opening_;
    std::uint64_t openings_ = 0;  ///< the number of the current one
};

}  // namespace lumacast
