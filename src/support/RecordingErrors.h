#pragma once
#include <cstdint>
#include <string_view>

#include "base/Value.h"

namespace lumacast {

class Localization;

/// The domain of every error that reaches a client.
inline constexpr std::string_view kRecordingErrorDomain = "com.orvane.Lumacast.LCRecordingErrorDomain";

/// The codes of that domain: one block without a gap.
enum class RecordingErrorCode : std::int64_t {
    Unknown = -5800,
    UserDeclined = -5801,
    Disabled = -5802,
    FailedToStart = -5803,
    Failed = -5804,
    InsufficientStorage = -5805,
    Interrupted = -5806,
    ContentResize = -5807,
    InvalidBroadcastSession = -5808,
    SystemDormancy = -5809,
    Entitlements = -5810,
    ActivePhoneCall = -5811,
    FailedToSave = -5812,
    DashLink = -5813,
    ConnectionInvalid = -5814,
    ConnectionInterrupted = -5815,
    NoContextIDMatch = -5816,
    MediaServicesFailed = -5817,
    MixingFailure = -5818,
};

/// The localisation key of a code; the unknown key for every code outside the block.
std::string_view recordingErrorKey(std::int64_t code);

/// The one place that builds recording errors. Callable from any lane.
class RecordingErrors {
public:
    explicit RecordingErrors(Localization& localization) : localization_(localization) {}

    /// `_lcUserErrorForCode:userInfo:` — an error with this code, exactly as given, whose user info is `userInfo` with
    /// the code's localised description set over it. Without a localised text the user info stays as it is. Cannot
    /// fail.
    Error _lcUserErrorForCode(std::int64_t code, Dictionary userInfo = {}) const;
    Error _lcUserErrorForCode(RecordingErrorCode code, Dictionary userInfo = {}) const {
        return _lcUserErrorForCode(static_cast<std::int64_t>(code), std::move(userInfo));
    }

private:
    Localization& localization_;
};

}  // namespace lumacast
