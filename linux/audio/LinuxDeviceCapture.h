#pragma once
#include <memory>

#include "linux/audio/DeviceAudioSession.h"
#include "linux/audio/LinuxDeviceCaptureSession.h"
#include "linux/audio/TapSource.h"
#include "platform/Clock.h"
#include "platform/DeviceCapture.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// The microphone, as the port opens it. Nothing asks for it before a session runs. Callable from any lane; waits for nobody.
class LinuxDeviceCapture final : public DeviceCapture {
public:
    /// `clock` outlives this and every session; `scheduler` outlives this.
    LinuxDeviceCapture(sound::OpenMicrophone openMicrophone, Clock& clock, Scheduler& scheduler)
        : openMicrophone_(std::move(openMicrophone)), clock_(clock), scheduler_(scheduler), audioSession_(scheduler) {}

    std::shared_ptr<DeviceCaptureSession> makeSession() override {
        return std::make_shared<LinuxDeviceCaptureSession>(DeviceServices{openMicrophone_, clock_, audioSession_},
                                                           scheduler_);
    }
    /// Never null: whether there is a microphone is known only when it is opened.
    std::shared_ptr<CaptureInput> defaultAudioInput() override { return std::make_shared<MicrophoneInput>(); }
    std::shared_ptr<CaptureOutput> makeAudioDataOutput() override {
        return std::make_shared<sound::DeviceAudioOutput>();
    }
    AudioSession& sharedAudioSession() override { return audioSession_; }

private:
    const sound::OpenMicrophone openMicrophone_;
    Clock& clock_;
    Scheduler& scheduler_;
    sound::DeviceAudioSession audioSession_;
};

}  // namespace lumacast
