// A session's link to the upload extension of a broadcast. Runs on the request lane.

#include "session/LCRecordingSession.h"

namespace lumacast {

std::optional<BundleIdentifier> LCRecordingSession::broadcastExtensionID() const {
    const auto extension = broadcastExtension();
    return extension ? std::optional(extension->identifier()) : std::nullopt;
}

void LCRecordingSession::disableBroadcast() {
    log_.line("LCRecordingSession: disableBroadcast");
    setBroadcastExtension(nullptr);
    broadcastUserInfo_ = {};
    broadcastConfiguration_.reset();
    broadcastProcessMode_ = static_cast<std::int64_t>(BroadcastProcessMode::MovieClips);
}

void LCRecordingSession::_notifyExtensionOfAction(ExtensionAction action, Handler completion) {
    if (broadcastProcessMode_ != static_cast<std::int64_t>(BroadcastProcessMode::SampleBuffers)) {
        completion();
        return;
    }
    if (!broadcastExtension()) {
        log_.line("no broadcast extension found!");
        completion();
        return;
    }
    const auto proxy = broadcastUploadExtensionProxy();
    if (!proxy) {
        log_.line("broadcast extension not ready");
        completion();
        return;
    }
    proxy->processPayload({{"LCBroadcastProcessExtensionPayloadKeyActionType", static_cast<std::int64_t>(action)},
                           {"LCBroadcastExtensionKeyExtensionUserInfo", broadcastUserInfo_}},
                          std::move(completion));
}

}  // namespace lumacast
