#include "base/RecordingErrorCodes.h"

#include <array>

namespace lumacast {

namespace {

/// By code + 5818. The last entry, of -5800, is the unknown key, which also serves every code outside the block.
constexpr std::array<std::string_view, 19> kKeys{
    "RECORDING_ERROR_MIXING_FAILURE",
    "RECORDING_ERROR_MEDIASERVICES_FAILED",
    "RECORDING_ERROR_NO_CONTEXTID_MATCH",
    "RECORDING_ERROR_CONNECTION_INTERRUPTED",
    "RECORDING_ERROR_CONNECTION_INVALID",
    "RECORDING_ERROR_DASHLINK",
    "RECORDING_ERROR_FAILED_TO_SAVE",
    "RECORDING_ERROR_ACTIVE_PHONE_CALL",
    "RECORDING_ERROR_ENTITLEMENTS",
    "RECORDING_ERROR_SYSTEM_DORMANCY",
    "RECORDING_ERROR_INVALID_BROADCAST_SESSION",
    "RECORDING_ERROR_CONTENT_RESIZE",
    "RECORDING_ERROR_INTERRUPTED",
    "RECORDING_ERROR_INSUFFICIENT_STORAGE",
    "RECORDING_ERROR_FAILED",
    "RECORDING_ERROR_FAILED_TO_START",
    "RECORDING_ERROR_DISABLED",
    "RECORDING_ERROR_USER_DECLINED",
    "RECORDING_ERROR_UNKNOWN",
};
constexpr auto kFirstCode = static_cast<std::int64_t>(RecordingErrorCode::MixingFailure);
constexpr auto kLastCode = static_cast<std::int64_t>(RecordingErrorCode::Unknown);
static_assert(kLastCode - kFirstCode + 1 == kKeys.size());

}  // namespace

std::string_view recordingErrorKey(std::int64_t code) {
    return code >= kFirstCode && code <= kLastCode ? kKeys[static_cast<std::size_t>(code - kFirstCode)] : kKeys.back();
}

}  // namespace lumacast
