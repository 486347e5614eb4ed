#pragma once
#include "platform/DeviceCapture.h"

namespace lumacast {

/// There is no device yet.
class LinuxDeviceCapture final : public DeviceCapture {
public:
    std::shared_ptr<DeviceCaptureSession> makeSession() override { return nullptr; }
    std::shared_ptr<CaptureInput> defaultAudioInput() override { return nullptr; }
    std::shared_ptr<CaptureOutput> makeAudioDataOutput() override { return nullptr; }
    AudioSession& sharedAudioSession() override { return session_; }

private:
    class NoAudioSession final : public AudioSession {
    public:
        bool setCategory(std::string_view, std::uint32_t) override { return false; }
        [[nodiscard]] std::unique_ptr<Registration> observeInterruptions(InterruptionHandler) override {
            return nullptr;
        }
    };
    NoAudioSession session_;
};

}  // namespace lumacast
