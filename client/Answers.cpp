#include "client/Answers.h"

namespace lumacast::client {

RecordingState recordingState(const Dictionary& state) {
    const auto flag = [&](std::string_view key) {
        const Value* value = state.find(key);
        const bool* on = value ? value->as<bool>() : nullptr;
        return on && *on;
    };
    RecordingState result;
    result.isRecording = flag("isRecording");
    result.isBroadcasting = flag("isBroadcasting");
    result.microphoneEnabled = flag("microphoneEnabled");
    result.isSystemRecording = flag("isSystemRecording");
    result.hasUserConsentForMicrophone = flag("hasUserConsentForMicrophone");
    result.hasUserConsentForCamera = flag("hasUserConsentForCamera");
    result.microphoneEnabledPersistent = flag("microphoneEnabledPersistent");
    if (const Value* url = state.find("broadcastURL"))
        if (const URL* address = url->as<URL>()) result.broadcastURL = *address;
    return result;
}

}  // namespace lumacast::client
