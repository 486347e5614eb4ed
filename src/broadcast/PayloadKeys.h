#pragma once
// Keys of what the daemon and an upload extension tell each other.

#include <string_view>

namespace lumacast {

// Items of an extension request in movie-clip mode, by their titles.
inline constexpr std::string_view kItemRequestedFinish = "LCBroadcastExtensionKeyRequestedFinish";
inline constexpr std::string_view kItemSandboxToken = "LCBroadcastExtensionKeyExtensionSandboxToken";
inline constexpr std::string_view kItemUserInfo = "LCBroadcastExtensionKeyExtensionUserInfo";
inline constexpr std::string_view kItemMovieClipURL = "LCBroadcastExtensionKeyMovieClipURL";
// Items that the extension may return.
inline constexpr std::string_view kItemBroadcastConfiguration = "LCBroadcastExtensionKeyBroadcastConfiguration";
inline constexpr std::string_view kItemServiceInfo = "LCBroadcastExtensionKeyExtensionServiceInfo";

// Payloads in sample-buffer mode.
inline constexpr std::string_view kPayloadActionType = "LCBroadcastProcessExtensionPayloadKeyActionType";
/// Deliberately the same name as a clip's item.
inline constexpr std::string_view kPayloadUserInfo = kItemUserInfo;
/// Deliberately without the others' prefix.
inline constexpr std::string_view kPayloadVideoOrientation = "LCSampleBufferVideoOrientation";
inline constexpr std::string_view kPayloadSampleType = "LCBroadcastProcessExtensionPayloadKeySampleType";
inline constexpr std::string_view kPayloadSharedPlane = "LCBroadcastProcessExtensionPayloadKeySharedPlane";
inline constexpr std::string_view kPayloadTimingInfo = "LCBroadcastProcessExtensionPayloadKeyTimingInfo";
inline constexpr std::string_view kPayloadAudioBufferList = "LCBroadcastProcessExtensionPayloadKeyAudioBufferList";
inline constexpr std::string_view kPayloadAudioFormat =
    "LCBroadcastProcessExtensionPayloadKeyAudioFormatDescription";
inline constexpr std::string_view kPayloadNumSamples = "LCBroadcastProcessExtensionPayloadKeyNumSamples";
inline constexpr std::string_view kPayloadFrontmostApp =
    "LCBroadcastProcessExtensionPayloadKeyFrontmostAppBundleID";

}  // namespace lumacast
