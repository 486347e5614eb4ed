#include "client/ClientMessages.h"

#include <cstring>
#include <memory>

#include "base/MessageTables.h"

namespace lumacast::client {

namespace {

constexpr std::int64_t kApplicationSound = 2;
constexpr std::int64_t kMicrophone = 3;

/// A record as it was sent, byte for byte; none when the bytes are not its size.
template <class Record>
std::optional<Record> recordIn(const Value& value) {
    const Data* bytes = value.as<Data>();
    if (!bytes || bytes->size() != sizeof(Record)) return std::nullopt;
    Record record;
    std::memcpy(static_cast<void*>(&record), bytes->data(), sizeof record);
    return record;
}

template <class T>
std::optional<T> optionalIn(const Value& value) {
    const T* held = value.as<T>();
    return held ? std::optional(*held) : std::nullopt;
}

}  // namespace

void ClientMessages::deliver(std::uint16_t message, const Array& arguments) {
    switch (static_cast<ClientMessage>(message)) {
        case ClientMessage::UpdateScreenRecordingState:
            if (events_.recordingStateChanged) events_.recordingStateChanged(*arguments[0].as<bool>());
            break;
        case ClientMessage::StopRecordingWithError: {
            const Error* error = arguments[0].asError();
            if (events_.stopped)
                events_.stopped(error ? std::optional(*error) : std::nullopt, optionalIn<URL>(arguments[1]));
            break;
        }
        case ClientMessage::UpdateBroadcastServiceInfo:
            if (events_.broadcastServiceInfo) events_.broadcastServiceInfo(arguments[0]);
            break;
        case ClientMessage::UpdateBroadcastURL:
            if (events_.broadcastURL) events_.broadcastURL(optionalIn<URL>(arguments[0]));
            break;
        case ClientMessage::CaptureHandlerWithSample: deliverVideo(arguments); break;
        case ClientMessage::CaptureHandlerWithAudioSample: deliverAudio(arguments); break;
        case ClientMessage::RecordingLockInterrupted:
            if (events_.interrupted) events_.interrupted(arguments[0]);
            break;
        case ClientMessage::RecordingTimerDidUpdate:
            if (events_.timerUpdated) events_.timerUpdated(arguments[0]);
            break;
    }
}

void ClientMessages::deliverVideo(const Array& arguments) {
    const auto timing = recordIn<SampleTiming>(arguments[1]);
    if (!events_.videoSample || !timing) return;
    if (lastPresentation_ && std::memcmp(&*lastPresentation_, &timing->presentation, sizeof(MediaTime)) == 0) return;
    lastPresentation_ = timing->presentation;
    const auto* plane = arguments[0].as<Value::PlaneRef>();
    events_.videoSample({plane ? *plane : nullptr, *timing});
}

void ClientMessages::deliverAudio(const Array& arguments) {
    const auto format = recordIn<AudioFormat>(arguments[1]);
    const auto timing = recordIn<SampleTiming>(arguments[4]);
    const std::int64_t type = *arguments[3].as<std::int64_t>();
    if (!events_.audioSample || !format || !timing || (type != kApplicationSound && type != kMicrophone)) return;
    events_.audioSample(
        {type == kMicrophone ? AudioSample::Source::Microphone : AudioSample::Source::Application, *format,
         *arguments[0].as<Data>(), *arguments[2].as<std::int64_t>(), *timing});
}

}  // namespace lumacast::client
