#include "linux/audio/MicrophoneStream.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "linux/system/LinuxClock.h"

namespace lumacast::sound {

namespace {

/// How much comes at a time, as far as the server minds us, and what it may keep for us when we are late; more is lost.
constexpr double kFragmentSeconds = 0.02, kMostKeptSeconds = 1;
/// Without sound for so many nanoseconds it was interrupted.
constexpr std::int64_t kInterruption = 60'000'000;
/// In microseconds; what a server says beyond it is nonsense.
constexpr pa_usec_t kLongestLatency = 10'000'000;
constexpr std::int64_t kLongestAge = 60'000'000;

}  // namespace

MicrophoneStream::MicrophoneStream(const PulseServer& server, const ListedMicrophone& microphone,
                                   const SoundTimeline& timeline, Heard heard, std::function<void()> changed)
    : source_(microphone.index),
      countsPieces_(microphone.isPipeWire),
      timeline_(timeline),
      heard_(std::move(heard)),
      changed_(std::move(changed)),
      // The average of all its channels, wherever they are: a microphone's sides don't matter for one channel.
      mixDown_(std::vector<Side>(microphone.channels.channels, Side::Middle), 1),
      position_(timeline.rate) {
    format_.format = PA_SAMPLE_FLOAT32NE;
    format_.rate = static_cast<std::uint32_t>(std::lround(timeline.rate));
    format_.channels = microphone.channels.channels;
    const PropertyListHandle properties(pa_proplist_new());
    // PipeWire: this source or none, never another one in its place, from the beginning and later.
    pa_proplist_sets(properties.get(), "node.dont-reconnect", "true");
    pa_proplist_sets(properties.get(), "node.dont-fallback", "true");
    stream_.reset(pa_stream_new_with_proplist(&server.context, "microphone", &format_, &microphone.channels,
                                              properties.get()));
    if (!stream_) {
        end();
        return;
    }
    pa_stream_set_state_callback(
        stream_.get(), [](pa_stream*, void* self) { static_cast<MicrophoneStream*>(self)->stateChanged(); }, this);
    pa_stream_set_read_callback(
        stream_.get(), [](pa_stream*, std::size_t, void* self) { static_cast<MicrophoneStream*>(self)->hear(); }, this);
    pa_stream_set_latency_update_callback(
        stream_.get(), [](pa_stream*, void* self) { static_cast<MicrophoneStream*>(self)->timingCame(); }, this);
    pa_stream_set_suspended_callback(
        stream_.get(), [](pa_stream*, void* self) { static_cast<MicrophoneStream*>(self)->changed_(); }, this);
    pa_stream_set_moved_callback(
        stream_.get(),
        [](pa_stream*, void* pointer) {
            // To another source, in spite of the flag below.
            auto& self = *static_cast<MicrophoneStream*>(pointer);
            self.end();
            self.changed_();
        },
        this);
    const auto bytesOf = [this](double seconds) {
        return static_cast<std::uint32_t>(pa_usec_to_bytes(static_cast<pa_usec_t>(seconds * 1e6), &format_));
    };
    pa_buffer_attr buffer{};
    buffer.maxlength = bytesOf(kMostKeptSeconds);
    buffer.fragsize = bytesOf(kFragmentSeconds);
    buffer.tlength = buffer.prebuf = buffer.minreq = static_cast<std::uint32_t>(-1);
    constexpr int kFlags = PA_STREAM_DONT_MOVE | PA_STREAM_ADJUST_LATENCY | PA_STREAM_AUTO_TIMING_UPDATE;
    if (pa_stream_connect_record(stream_.get(), microphone.name.c_str(), &buffer,
                                 static_cast<pa_stream_flags_t>(kFlags)) < 0)
        end();
}

bool MicrophoneStream::isSuspended() const {
    return state_ == State::Ready && pa_stream_is_suspended(stream_.get()) > 0;
}

void MicrophoneStream::end() { state_ = State::Ended; }

void MicrophoneStream::stateChanged() {
    if (hasEnded()) return;
    const pa_stream_state_t state = pa_stream_get_state(stream_.get());
    if (state == PA_STREAM_READY) {
        // The name may have become another source's since it was looked at.
        state_ = pa_stream_get_device_index(stream_.get()) == source_ ? State::Ready : State::Ended;
        changed_();
    } else if (!PA_STREAM_IS_GOOD(state)) {
        end();
        changed_();
    }
}

void MicrophoneStream::askWhen() {
    isAsking_ = true;
    pa_operation* const operation = pa_stream_update_timing_info(
        stream_.get(),
        [](pa_stream*, int success, void* self) {
            if (success == 0) static_cast<MicrophoneStream*>(self)->isAsking_ = false;
        },
        this);
    if (operation)
        pa_operation_unref(operation);
    else
        isAsking_ = false;
}

void MicrophoneStream::timingCame() {
    isAsking_ = false;
    const pa_timing_info* const timing = pa_stream_get_timing_info(stream_.get());
    if (!timing || timing->write_index_corrupt || timing->write_index < 0) return;
    // At that moment of wall time as many bytes had been recorded as the server says, and the last of them had been
    // heard the source's latency before. The library's own estimate is smoothed: it takes many seconds to come near.
    timeval wallTime{};
    const auto age = static_cast<std::int64_t>(pa_timeval_diff(pa_gettimeofday(&wallTime), &timing->timestamp));
    const auto written =
        static_cast<std::int64_t>(pa_bytes_to_usec(static_cast<std::uint64_t>(timing->write_index), &format_));
    latency_ = static_cast<std::int64_t>(std::min(timing->source_usec, kLongestLatency));
    const std::int64_t since = std::min(age, kLongestAge) + written + latency_;
    took(HostTime{LinuxClock::currentHostTime().nanoseconds - since * 1000});
    takeIn();
}

void MicrophoneStream::took(HostTime origin) {
    if (!countsPieces_) origin_.forget();
    origin_.take(LinuxClock::currentHostTime(), origin);
    zero_ = *origin_.origin();
}

void MicrophoneStream::hear() {
    if (state_ != State::Ready || pa_stream_readable_size(stream_.get()) == 0) return;
    const HostTime now = LinuxClock::currentHostTime();
    // After an interruption nobody knows when this was heard. It waits in the library for the answer.
    if (now.nanoseconds - lastHeard_.nanoseconds > kInterruption && !isAsking_) origin_.forget();
    lastHeard_ = now;
    if (!origin_.origin() && !isAsking_) askWhen();
    if (!isAsking_) takeIn();
}

void MicrophoneStream::takeIn() {
    if (state_ != State::Ready || !origin_.origin()) return;
    const HostTime now = LinuxClock::currentHostTime();
    const std::size_t waiting = pa_stream_readable_size(stream_.get());
    if (waiting == 0 || waiting == static_cast<std::size_t>(-1)) return;
    if (const pa_timing_info* const timing = pa_stream_get_timing_info(stream_.get());
        countsPieces_ && timing && timing->read_index >= 0) {
        const auto arrived = static_cast<std::uint64_t>(timing->read_index) + waiting;
        const auto since = static_cast<std::int64_t>(pa_bytes_to_usec(arrived, &format_)) + latency_;
        took(HostTime{now.nanoseconds - since * 1000});
    }
    while (true) {
        const pa_timing_info* const timing = pa_stream_get_timing_info(stream_.get());
        const void* data = nullptr;
        std::size_t bytes = 0;
        if (!timing || timing->read_index < 0 || pa_stream_peek(stream_.get(), &data, &bytes) < 0 || bytes == 0) return;
        const auto read =
            static_cast<std::int64_t>(pa_bytes_to_usec(static_cast<std::uint64_t>(timing->read_index), &format_));
        const auto frames = static_cast<std::int64_t>(bytes / pa_frame_size(&format_));
        // Nothing is heard before it comes, whatever the server says.
        const std::int64_t heard = std::min(timeline_.frameAt(HostTime{zero_.nanoseconds + read * 1000}),
                                            timeline_.frameAt(now) - frames);
        const auto piece = position_.place(heard, frames);
        // Without data it is a hole: time passes, and there is silence.
        if (data)
            mixDown_.mix({static_cast<const float*>(data), static_cast<std::size_t>(frames) * format_.channels},
                         piece.frames, mixed_);
        else
            mixed_.assign(static_cast<std::size_t>(piece.frames), 0.0f);
        pa_stream_drop(stream_.get());
        heard_(piece.frame, mixed_);
    }
}

}  // namespace lumacast::sound
