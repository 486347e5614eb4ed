#include "linux/audio/Microphone.h"

#include <chrono>
#include <utility>

#include "linux/audio/DeviceSamples.h"
#include "linux/system/LinuxClock.h"

namespace lumacast::sound {

namespace {

using std::chrono::milliseconds;

constexpr milliseconds kRetry{300}, kWatch{500};
/// More than one, so that a sound thread that was late itself finds no silence.
constexpr int kSilentWatches = 6;

}  // namespace

Microphone::Microphone(MicrophoneListener listener)
    : listener_(std::move(listener)), timeline_{LinuxClock::currentHostTime(), microphoneFormat().sampleRate} {}

Microphone::Session::Session(const PulseServer& there, Microphone& microphone)
    : server(there),
      reader(there.context, [&microphone](const ListedMicrophone* listed) { microphone.decide(listed); }),
      again(there.loop, [&microphone] { microphone.look(); }),
      watch(there.loop, [&microphone] { microphone.watch(); }) {}

void Microphone::serverCame(const PulseServer& server) {
    session_ = std::make_unique<Session>(server, *this);
    session_->watch.start(kWatch);
    read();
}

void Microphone::serverWent() {
    session_.reset();
    if (wasHeard_) setInterrupted(true);
}

pa_subscription_mask_t Microphone::interest() const {
    return static_cast<pa_subscription_mask_t>(PA_SUBSCRIPTION_MASK_SERVER | PA_SUBSCRIPTION_MASK_SOURCE |
                                               PA_SUBSCRIPTION_MASK_SOURCE_OUTPUT);
}

void Microphone::serverChanged(pa_subscription_event_type_t event, std::uint32_t /*index*/) {
    switch (event & PA_SUBSCRIPTION_EVENT_FACILITY_MASK) {
        case PA_SUBSCRIPTION_EVENT_SERVER:
        case PA_SUBSCRIPTION_EVENT_SOURCE:
        case PA_SUBSCRIPTION_EVENT_SOURCE_OUTPUT: return read();
        default: return;  // another user's interest
    }
}

void Microphone::read() {
    if (!session_) return;
    if (session_->reader.isReading())
        session_->isOutdated = true;
    else
        session_->reader.start();
}

void Microphone::decide(const ListedMicrophone* microphone) {
    if (session_->isOutdated || !microphone) {
        const bool isOutdated = std::exchange(session_->isOutdated, false);
        session_->mustRead = true;
        session_->again.start(isOutdated ? milliseconds(0) : kRetry);
        return;
    }
    session_->isUndecided = microphone->isUndecided;
    if (microphone->isTaken) {
        closeStream();
        setInterrupted(true);
        return;
    }
    auto& stream = session_->stream;
    if (stream && (stream->hasEnded() || stream->source() != microphone->index)) closeStream();
    if (stream || microphone->index == PA_INVALID_INDEX) return;
    stream = std::make_unique<MicrophoneStream>(
        session_->server, *microphone, timeline_,
        [this](std::int64_t first, std::span<const float> samples) { heard(first, samples); },
        [this] { session_->again.start(milliseconds(0)); });
    if (stream->hasEnded()) session_->again.start(kRetry);
}

/// Also after what closed the stream has passed: whatever is not right any more is read anew, and what has changed while it
/// was read, though the stream is as it was.
void Microphone::look() {
    const bool mustRead = std::exchange(session_->mustRead, false);
    const auto& stream = session_->stream;
    if (stream && stream->isSuspended()) setInterrupted(true);
    if (stream && (stream->isSuspended() || !stream->hasEnded())) {
        if (mustRead) read();
        return;
    }
    const bool hadStream = stream != nullptr;
    closeStream();
    // A source that refuses is asked again, but not without a pause.
    if (hadStream) return session_->again.start(kRetry);
    read();
}

void Microphone::watch() {
    session_->watch.start(kWatch);
    if (session_->isUndecided) read();
    if (++silentWatches_ >= kSilentWatches && wasHeard_) setInterrupted(true);
}

void Microphone::closeStream() {
    if (!session_->stream) return;
    session_->stream.reset();
    if (wasHeard_) setInterrupted(true);
}

void Microphone::heard(std::int64_t first, std::span<const float> samples) {
    // Streams that follow each other may overlap by a little; nothing is heard twice.
    const std::int64_t early = std::max<std::int64_t>(0, next_ - first);
    if (early >= static_cast<std::int64_t>(samples.size())) return;
    silentWatches_ = 0;
    wasHeard_ = true;
    setInterrupted(false);
    next_ = first + static_cast<std::int64_t>(samples.size());
    listener_.heard(timeline_, first + early, samples.subspan(static_cast<std::size_t>(early)));
}

void Microphone::setInterrupted(bool isInterrupted) {
    if (std::exchange(isInterrupted_, isInterrupted) != isInterrupted) listener_.interrupted(isInterrupted);
}

}  // namespace lumacast::sound
