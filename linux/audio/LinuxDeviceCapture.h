#pragma once
#include <memory>

#include "linux/audio/DeviceAudioSession.h"
#include "linux/audio/LinuxDeviceCaptureSession.h"
#include "linux/audio/PulseConnection.h"
#include "platform/Clock.h"
#include "platform/DeviceCapture.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// The microphone of the user's sound server, PulseAudio or PipeWire. Nothing asks the server before a session runs.
/// Callable from any lane; waits for nobody.
class LinuxDeviceCapture final : public DeviceCapture {
public:
    /// `clock` outlives this and every session; `scheduler` outlives this.
    LinuxDeviceCapture(std::shared_ptr<sound::PulseConnection> connection, Clock& clock, Scheduler& scheduler)
        : connection_(std::move(connection)), clock_(clock), scheduler_(scheduler), audioSession_(scheduler) {}

    std::shared_ptr<DeviceCaptureSession> makeSession() override {
        return std::make_shared<LinuxDeviceCaptureSession>(DeviceServices{connection_, clock_, audioSession_},
                                                           scheduler_);
    }
    /// Never null: whether there is a microphone only the server knows.
    std::shared_ptr<CaptureInput> defaultAudioInput() override { return std::make_shared<MicrophoneInput>(); }
    std::shared_ptr<CaptureOutput> makeAudioDataOutput() override {
        return std::make_shared<sound::DeviceAudioOutput>();
    }
    AudioSession& sharedAudioSession() override { return audioSession_; }

private:
    const std::shared_ptr<sound::PulseConnection> connection_;
    Clock& clock_;
    Scheduler& scheduler_;
    sound::DeviceAudioSession audioSession_;
};

}  // namespace lumacast
