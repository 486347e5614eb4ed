#pragma once
// The errors that reach a client: their domain, codes and keys. Shared by the daemon, which builds them, and the client
// library, which reads them.

#include <cstdint>
#include <string_view>

namespace lumacast {

/// The domain of every error that the daemon reports to a client.
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

/// The localisation key of a code ("RECORDING_ERROR_..."); the unknown key for every code outside the block. Static.
std::string_view recordingErrorKey(std::int64_t code);

}  // namespace lumacast
