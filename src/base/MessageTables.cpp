#include "base/MessageTables.h"

#include <algorithm>
#include <array>
#include <limits>

#include "base/Limits.h"

namespace lumacast {

namespace {

using A = ArgumentType;

constexpr std::array kStart{A::ContextIDs, A::Size, A::Bool, A::Bool, A::Bool, A::Bool, A::Bool, A::NullableEndpoint};
constexpr std::array kStartReply{A::NullableError, A::Bool, A::Bool};
constexpr std::array kSetup{A::Text, A::Text, A::Data, A::NullableDictionary};
constexpr std::array kErrorReply{A::NullableError};
constexpr std::array kImagesReply{A::NullableData, A::NullableData};
constexpr std::array kExtensionsReply{A::Array, A::NullableError};
constexpr std::array kStopReply{A::NullableURL, A::NullableError};
constexpr std::array kClip{A::Double, A::Double};
constexpr std::array kNullableURL{A::NullableURL};
constexpr std::array kBool{A::Bool};
constexpr std::array kInt32{A::Int32};
constexpr std::array kUInt32{A::UInt32};
constexpr std::array kStateReply{A::NullableDictionary};
constexpr std::array kStopped{A::NullableError, A::NullableURL};
constexpr std::array kVideoSample{A::SharedPlaneObject, A::Data};
constexpr std::array kAudioSample{A::Data, A::Data, A::Int64, A::Int64, A::Data};
constexpr std::array kAny{A::Any};
constexpr std::array kPlain{A::Plain};
constexpr std::array kError{A::NullableError};
constexpr std::array kPayload{A::Dictionary};
constexpr std::array kEndpoint{A::NullableEndpoint};

constexpr std::span<const A> kNothing{};

constexpr std::array kDaemonMessages{
    MessageDeclaration{"startRecordingWindowLayerContextIDs:windowSize:microphoneEnabled:cameraEnabled:broadcast:"
                       "systemRecording:captureEnabled:listenerEndpoint:withHandler:",
                       kStart, Reply::Expected, kStartReply},
    MessageDeclaration{
        "setupBroadcastWithHostBundleID:broadcastExtensionBundleID:broadcastConfigurationData:userInfo:handler:",
        kSetup, Reply::Expected, kErrorReply},
    MessageDeclaration{"getCurrentBroadcastImages:", kNothing, Reply::Expected, kImagesReply},
    MessageDeclaration{"getSystemBroadcastExtensionInfo:", kNothing, Reply::Expected, kExtensionsReply},
    MessageDeclaration{"stopRecordingWithHandler:", kNothing, Reply::Expected, kStopReply},
    MessageDeclaration{"stopRecordingWithStartClipDuration:endClipDuration:handler:", kClip, Reply::Expected,
                       kStopReply},
    MessageDeclaration{"saveVideoToCameraRoll:handler:", kNullableURL, Reply::Expected, kErrorReply},
    MessageDeclaration{"pauseRecording", kNothing},
    MessageDeclaration{"resumeRecordingWithWindowLayerContextID:", kUInt32},
    MessageDeclaration{"setMicrophoneEnabled:", kBool},
    MessageDeclaration{"updateProcessIDForAudioCaptureWithPID:", kInt32},
    MessageDeclaration{"discardRecordingWithHandler:", kNothing, Reply::Expected, kNothing},
    MessageDeclaration{"clientDidBecomeActive", kNothing},
    MessageDeclaration{"clientDidResignActive", kNothing},
    MessageDeclaration{"synchronousGetCurrentState:", kNothing, Reply::Expected, kStateReply},
    MessageDeclaration{"setHasUserConsentForCamera:", kBool},
    MessageDeclaration{"setHasUserConsentForMicrophone:", kBool},
    MessageDeclaration{"setBroadcastURL:", kNullableURL},
    MessageDeclaration{"setMicrophoneEnabledPersistent:", kBool},
    MessageDeclaration{"reportCameraUsage:", kInt32},
};

constexpr std::array kClientMessages{
    MessageDeclaration{"updateScreenRecordingState:", kBool},
    MessageDeclaration{"stopRecordingWithError:movieURL:", kStopped},
    MessageDeclaration{"updateBroadcastServiceInfo:", kAny},
    MessageDeclaration{"updateBroadcastURL:", kNullableURL},
    MessageDeclaration{"captureHandlerWithSample:timingData:", kVideoSample},
    MessageDeclaration{"captureHandlerWithAudioSample:absdData:itemCount:bufferType:timingData:", kAudioSample},
    MessageDeclaration{"recordingLockInterrupted:", kAny},
    MessageDeclaration{"recordingTimerDidUpdate:", kAny},
};

constexpr std::array kBroadcastDaemonMessages{
    MessageDeclaration{"ping", kNothing},
    MessageDeclaration{"updateServiceInfo:", kPlain},
    MessageDeclaration{"updateBroadcastURL:", kNullableURL},
    MessageDeclaration{"finishBroadcastWithError:", kError},
};

constexpr std::array kBroadcastExtensionMessages{
    MessageDeclaration{"processPayload:completion:", kPayload, Reply::Expected, kNothing},
};

constexpr std::array kExtensionVendorMessages{
    MessageDeclaration{"setEndpoint:completionHandler:", kEndpoint, Reply::Expected, kNothing},
};

constexpr Protocol kDaemonProtocol{"LCDaemonProtocol", kDaemonMessages};
constexpr Protocol kClientProtocol{"LCClientProtocol", kClientMessages};
constexpr Protocol kBroadcastDaemonProtocol{"LCBroadcastDaemonProtocol", kBroadcastDaemonMessages};
constexpr Protocol kBroadcastExtensionProtocol{"LCBroadcastExtensionProtocol", kBroadcastExtensionMessages};
constexpr Protocol kExtensionVendorProtocol{"LCExtensionVendorProtocol", kExtensionVendorMessages};
constexpr Protocol kExtensionHostProtocol{"LCExtensionHostProtocol", {}};

static_assert(kDaemonMessages.size() == static_cast<std::size_t>(DaemonMessage::ReportCameraUsage) + 1);
static_assert(kBroadcastDaemonMessages.size() ==
              static_cast<std::size_t>(BroadcastDaemonMessage::FinishBroadcastWithError) + 1);
static_assert(kClientMessages.size() == static_cast<std::size_t>(ClientMessage::RecordingTimerDidUpdate) + 1);

template <class Number, class Wide>
bool fits(const Value& value) {
    const Wide* number = value.as<Wide>();
    return number && *number >= std::numeric_limits<Number>::min() && *number <= std::numeric_limits<Number>::max();
}

bool isContextIDList(const Value& value) {
    const Array* ids = value.as<Array>();
    if (!ids || ids->size() > limitOf(Limit::ContextIdentifiersPerRequest)) return false;
    for (const Value& id : *ids)
        if (!fits<std::uint32_t, std::uint64_t>(id)) return false;
    return true;
}

bool isSize(const Value& value) {
    const Array* pair = value.as<Array>();
    return pair && pair->size() == 2 && (*pair)[0].as<double>() && (*pair)[1].as<double>();
}

/// Whether the value and all that is in it, at any depth, are none of what `isForbidden` says.
bool isWithout(const Value& value, bool (*isForbidden)(const Value&)) {
    if (isForbidden(value)) return false;
    const auto isFree = [isForbidden](const Value& inner) { return isWithout(inner, isForbidden); };
    if (const Array* array = value.as<Array>()) return std::all_of(array->begin(), array->end(), isFree);
    const auto isFreeDictionary = [&](const Dictionary& dictionary) {
        const auto& entries = dictionary.entries();
        return std::all_of(entries.begin(), entries.end(), [&](const auto& entry) { return isFree(entry.second); });
    };
    if (const Dictionary* dictionary = value.as<Dictionary>()) return isFreeDictionary(*dictionary);
    const Error* error = value.asError();
    return !error || isFreeDictionary(error->userInfo());
}

/// An endpoint travels only where a message declares it.
bool isPlain(const Value& value) {
    return isWithout(value, [](const Value& v) { return v.as<Value::EndpointRef>() != nullptr; });
}

bool isWithoutHandles(const Value& value) {
    return isWithout(value, [](const Value& v) { return v.as<Value::EndpointRef>() || v.as<Value::PlaneRef>(); });
}

bool isOfType(const Value& value, ArgumentType type) {
    switch (type) {
        case A::Bool: return value.as<bool>();
        case A::Int32: return fits<std::int32_t, std::int64_t>(value);
        case A::UInt32: return fits<std::uint32_t, std::uint64_t>(value);
        case A::Int64: return value.as<std::int64_t>();
        case A::Double: return value.as<double>();
        case A::Size: return isSize(value);
        case A::ContextIDs: return isContextIDList(value);
        case A::Text: return value.as<std::string>();
        case A::Data: return value.as<Data>();
        case A::NullableData: return value.isNull() || value.as<Data>();
        case A::Dictionary: return value.as<Dictionary>() && isPlain(value);
        case A::NullableDictionary: return value.isNull() || (value.as<Dictionary>() && isPlain(value));
        case A::Array: return value.as<Array>() && isPlain(value);
        case A::URL: return value.as<URL>();
        case A::NullableURL: return value.isNull() || value.as<URL>();
        case A::NullableEndpoint: return value.isNull() || value.as<Value::EndpointRef>();
        case A::NullableError: return value.isNull() || (value.asError() && isPlain(value));
        case A::SharedPlaneObject: return value.isNull() || value.as<Value::PlaneRef>();
        case A::Any: return true;
        case A::Plain: return isWithoutHandles(value);
    }
    return false;
}

}  // namespace

const Protocol& daemonProtocol() { return kDaemonProtocol; }
const Protocol& clientProtocol() { return kClientProtocol; }
const Protocol& broadcastDaemonProtocol() { return kBroadcastDaemonProtocol; }
const Protocol& broadcastExtensionProtocol() { return kBroadcastExtensionProtocol; }
const Protocol& extensionVendorProtocol() { return kExtensionVendorProtocol; }
const Protocol& extensionHostProtocol() { return kExtensionHostProtocol; }

bool matches(const Array& values, std::span<const ArgumentType> types) {
    if (values.size() != types.size()) return false;
    for (std::size_t i = 0; i < types.size(); ++i)
        if (!isOfType(values[i], types[i])) return false;
    return true;
}

}  // namespace lumacast
