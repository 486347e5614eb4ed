#include <array>

#include "base/RecordingErrorCodes.h"
#include "client/lumacastctl/usage/Usage.h"

namespace lumacast::ctl {

namespace {

struct Words {
    RecordingErrorCode code;
    const char* text;
};

constexpr std::array kWords{
    Words{RecordingErrorCode::Unknown, "an unknown error"},
    Words{RecordingErrorCode::UserDeclined, "the user declined"},
    Words{RecordingErrorCode::Disabled, "recording is disabled"},
    Words{RecordingErrorCode::FailedToStart, "it could not be started"},
    Words{RecordingErrorCode::Failed, "it failed"},
    Words{RecordingErrorCode::InsufficientStorage, "too little storage"},
    Words{RecordingErrorCode::Interrupted, "it was interrupted"},
    Words{RecordingErrorCode::ContentResize, "its content was resized"},
    Words{RecordingErrorCode::InvalidBroadcastSession, "its broadcast is not valid"},
    Words{RecordingErrorCode::SystemDormancy, "the device went to sleep"},
    Words{RecordingErrorCode::Entitlements, "its application may not"},
    Words{RecordingErrorCode::ActivePhoneCall, "a phone call"},
    Words{RecordingErrorCode::FailedToSave, "the movie could not be written"},
    Words{RecordingErrorCode::DashLink, "a DashLink connection"},
    Words{RecordingErrorCode::ConnectionInvalid, "no connection to the daemon"},
    Words{RecordingErrorCode::ConnectionInterrupted, "the connection to the daemon broke"},
    Words{RecordingErrorCode::NoContextIDMatch, "none of its windows matched"},
    Words{RecordingErrorCode::MediaServicesFailed, "the capture failed: its window or the display is gone"},
    Words{RecordingErrorCode::MixingFailure, "its sounds could not be mixed"},
};

}  // namespace

std::string endReasonText(std::int64_t code) {
    if (code == 0) return "it ended without an error";
    std::string text = "an unknown reason";
    for (const Words& words : kWords)
        if (static_cast<std::int64_t>(words.code) == code) text = words.text;
    return text + " (" + std::to_string(code) + ")";
}

}  // namespace lumacast::ctl
