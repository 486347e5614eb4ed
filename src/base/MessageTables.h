#pragma once
// Every message of the client's and the extension's protocols, declared once: name, arguments, reply. Both ends encode, check and
// dispatch from these tables; a message's number on the wire is its place in its table.

#include <cstdint>
#include <span>
#include <string_view>

#include "base/Value.h"

namespace lumacast {

/// What an argument or a reply value may be. `Nullable` forms also admit null.
enum class ArgumentType : std::uint8_t {
    Bool,
    Int32,
    UInt32,
    Int64,
    Double,
    Size,  ///< an array of two doubles: width, height
    ContextIDs,  ///< an array of unsigned 32-bit numbers
    Text,
    Data,
    NullableData,
    Dictionary,
    NullableDictionary,
    Array,
    URL,
    NullableURL,
    NullableEndpoint,
    NullableError,
    SharedPlaneObject,  ///< a shared plane, or null for a frame without one
    Any,  ///< anything; arrays, dictionaries and errors of the other types hold no endpoints
    Plain,  ///< anything without endpoints and planes
};

enum class Reply : bool { None, Expected };

struct MessageDeclaration {
    std::string_view name;
    std::span<const ArgumentType> arguments;
    Reply reply = Reply::None;
    std::span<const ArgumentType> replyValues = {};
};

struct Protocol {
    std::string_view name;
    std::span<const MessageDeclaration> messages;
};

/// What a client asks of the daemon, in declaration order.
enum class DaemonMessage : std::uint16_t {
    StartRecording,
    SetupBroadcast,
    GetCurrentBroadcastImages,
    GetSystemBroadcastExtensionInfo,
    StopRecording,
    StopRecordingWithClipDurations,
    SaveVideoToCameraRoll,
    PauseRecording,
    ResumeRecording,
    SetMicrophoneEnabled,
    UpdateProcessIDForAudioCapture,
    DiscardRecording,
    ClientDidBecomeActive,
    ClientDidResignActive,
    SynchronousGetCurrentState,
    SetHasUserConsentForCamera,
    SetHasUserConsentForMicrophone,
    SetBroadcastURL,
    SetMicrophoneEnabledPersistent,
    ReportCameraUsage,
};

/// What the daemon tells a client, in declaration order. None of them has a reply.
enum class ClientMessage : std::uint16_t {
    UpdateScreenRecordingState,
    StopRecordingWithError,
    UpdateBroadcastServiceInfo,
    UpdateBroadcastURL,
    CaptureHandlerWithSample,
    CaptureHandlerWithAudioSample,
    RecordingLockInterrupted,
    RecordingTimerDidUpdate,
};

/// What an upload extension tells the daemon, in declaration order. None of them has a reply.
enum class BroadcastDaemonMessage : std::uint16_t { Ping, UpdateServiceInfo, UpdateBroadcastURL, FinishBroadcastWithError };

/// What the daemon asks of an upload extension.
enum class BroadcastExtensionMessage : std::uint16_t { ProcessPayload };

/// What the daemon tells an extension over the auxiliary connection of a request.
enum class ExtensionVendorMessage : std::uint16_t { SetEndpoint };

const Protocol& daemonProtocol();  ///< LCDaemonProtocol, 20 messages
const Protocol& clientProtocol();  ///< LCClientProtocol, 8 messages
const Protocol& broadcastDaemonProtocol();     ///< LCBroadcastDaemonProtocol, 4 messages
const Protocol& broadcastExtensionProtocol();  ///< LCBroadcastExtensionProtocol, 1 message
const Protocol& extensionVendorProtocol();     ///< LCExtensionVendorProtocol, 1 message
const Protocol& extensionHostProtocol();       ///< LCExtensionHostProtocol, deliberately without messages

/// Whether `values` are what `types` declare: the same count, each of its type and within its type's range.
bool matches(const Array& values, std::span<const ArgumentType> types);

}  // namespace lumacast
