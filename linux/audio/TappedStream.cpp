#include "linux/audio/TappedStream.h"

#include <algorithm>
#include <cmath>

#include "linux/system/LinuxClock.h"

namespace lumacast::sound {

namespace {

/// How much comes at a time, as far as the server minds us.
constexpr double kFragmentSeconds = 0.02;
/// What the server may keep for us when we are late; more is lost.
constexpr double kMostKeptSeconds = 1;
/// Without sound for so many nanoseconds it was interrupted.
constexpr std::int64_t kInterruption = 60'000'000;
}  // namespace

TappedStream::TappedStream(const PulseServer& server, const ListedPlayback& playback, Account account,
                           std::shared_ptr<TapMix> mix, std::function<void()> changed)
    : playback_(playback),
      account_(account),
      mix_(std::move(mix)),
      changed_(std::move(changed)),
      mixDown_(sidesOf(playback.positions), mix_->channels()),
      lane_(mix_->addLane()),
      position_(mix_->rate()) {
    format_.format = PA_SAMPLE_FLOAT32NE;
    format_.rate = static_cast<std::uint32_t>(std::lround(mix_->rate()));
    format_.channels = static_cast<std::uint8_t>(playback_.positions.size());
    // The stream's own channels in its own order: the server mixes nothing down.
    pa_channel_map map{};
    map.channels = format_.channels;
    for (std::uint8_t channel = 0; channel < map.channels; ++channel)
        map.map[channel] = static_cast<pa_channel_position_t>(playback_.positions[channel]);
    const PropertyListHandle properties(pa_proplist_new());
    // PipeWire: this stream or none, never another one in its place, from the beginning and later.
    pa_proplist_sets(properties.get(), "node.dont-reconnect", "true");
    pa_proplist_sets(properties.get(), "node.dont-fallback", "true");
    stream_.reset(pa_stream_new_with_proplist(&server.context, "tap", &format_, &map, properties.get()));
    if (!stream_ || pa_stream_set_monitor_stream(stream_.get(), playback_.index) < 0) {
        end();
        return;
    }
    pa_stream_set_state_callback(
        stream_.get(), [](pa_stream*, void* self) { static_cast<TappedStream*>(self)->stateChanged(); }, this);
    pa_stream_set_read_callback(
        stream_.get(), [](pa_stream*, std::size_t, void* self) { static_cast<TappedStream*>(self)->hear(); }, this);
    pa_stream_set_latency_update_callback(
        stream_.get(), [](pa_stream*, void* self) { static_cast<TappedStream*>(self)->timingCame(); }, this);
    // Where it hangs now nobody has looked at.
    pa_stream_set_moved_callback(
        stream_.get(), [](pa_stream*, void* self) { static_cast<TappedStream*>(self)->distrust(); }, this);
    pa_buffer_attr buffer{};
    buffer.maxlength = static_cast<std::uint32_t>(pa_usec_to_bytes(static_cast<pa_usec_t>(kMostKeptSeconds * 1e6), &format_));
    buffer.fragsize = static_cast<std::uint32_t>(pa_usec_to_bytes(static_cast<pa_usec_t>(kFragmentSeconds * 1e6), &format_));
    buffer.tlength = buffer.prebuf = buffer.minreq = static_cast<std::uint32_t>(-1);
    constexpr int kFlags = PA_STREAM_DONT_MOVE | PA_STREAM_ADJUST_LATENCY | PA_STREAM_AUTO_TIMING_UPDATE |
                           PA_STREAM_DONT_INHIBIT_AUTO_SUSPEND;
    if (pa_stream_connect_record(stream_.get(), nullptr, &buffer, static_cast<pa_stream_flags_t>(kFlags)) < 0) end();
}

TappedStream::~TappedStream() { mix_->closeLane(lane_); }

std::uint32_t TappedStream::recording() const { return isReady() ? pa_stream_get_index(stream_.get()) : kNoIndex; }

void TappedStream::trust() { mix_->trust(*lane_); }

void TappedStream::distrust() {
    mix_->discardLane(lane_);
    end();
    changed_();
}

void TappedStream::end() {
    state_ = State::Ended;
    mix_->closeLane(lane_);
}

void TappedStream::stateChanged() {
    const pa_stream_state_t state = pa_stream_get_state(stream_.get());
    if (hasEnded()) return;
    if (state == PA_STREAM_READY) {
        state_ = State::Ready;
        readySince_ = std::chrono::steady_clock::now();
        changed_();
    } else if (!PA_STREAM_IS_GOOD(state)) {
        end();
        changed_();
    }
}

void TappedStream::took(const StreamAccount& account) {
    if (account_ == Account::AtAnyTime) origin_.forget();
    origin_.take(account.now, originBy(account, format_.rate));
}

void TappedStream::askWhen() {
    isAsking_ = true;
    if (pa_operation* const operation = pa_stream_update_timing_info(
            stream_.get(),
            [](pa_stream*, int success, void* self) {
                if (success == 0) static_cast<TappedStream*>(self)->isAsking_ = false;
            },
            this))
        pa_operation_unref(operation);
    else
        isAsking_ = false;
}

void TappedStream::timingCame() {
    isAsking_ = false;
    const pa_timing_info* const timing = pa_stream_get_timing_info(stream_.get());
    if (!timing || timing->write_index_corrupt || timing->write_index < 0) return;
    // At that moment of wall time as many bytes had been written as the server says, and the last of them was heard
    // the source's latency before, or the output's after. The library's own estimate is smoothed: it takes many
    // seconds to come near.
    timeval wallTime{};
    StreamAccount account;
    account.now = LinuxClock::currentHostTime();
    account.age = pa_timeval_diff(pa_gettimeofday(&wallTime), &timing->timestamp);
    account.frames = timing->write_index / static_cast<std::int64_t>(pa_frame_size(&format_));
    account.latency = latency_ = timing->source_usec;
    account.delay = delay_ = timing->sink_usec;
    took(account);
    takeIn();
}

void TappedStream::hear() {
    const HostTime now = LinuxClock::currentHostTime();
    // After an interruption nobody knows when this was heard. It waits in the library for the answer.
    const bool isInterrupted = now.nanoseconds - lastHeard_.nanoseconds > kInterruption;
    lastHeard_ = now;
    if (isInterrupted && !isAsking_) origin_.forget();
    if (!origin_.origin() && !isAsking_) askWhen();
    if (!isAsking_) takeIn();
}

void TappedStream::takeIn() {
    if (!isReady() || !origin_.origin() || pa_stream_readable_size(stream_.get()) == 0) return;
    const auto frameBytes = static_cast<std::int64_t>(pa_frame_size(&format_));
    if (const pa_timing_info* const timing = pa_stream_get_timing_info(stream_.get());
        account_ == Account::AtEachPiece && timing) {
        const auto waiting = static_cast<std::int64_t>(pa_stream_readable_size(stream_.get()));
        took({LinuxClock::currentHostTime(), 0, timing->read_index / frameBytes + waiting / frameBytes, latency_, delay_});
    }
    while (true) {
        const pa_timing_info* const timing = pa_stream_get_timing_info(stream_.get());
        const void* data = nullptr;
        std::size_t bytes = 0;
        if (!timing || pa_stream_peek(stream_.get(), &data, &bytes) < 0 || bytes == 0) return;
        const HostTime heard = momentOf(*origin_.origin(), timing->read_index / frameBytes, format_.rate);
        const std::size_t inputs = format_.channels;
        const auto frames = static_cast<std::int64_t>(bytes) / frameBytes;
        const auto piece = position_.place(mix_->frameAt(heard), frames);
        // Without data it is a hole: time passes, and there is silence.
        if (data) {
            mixDown_.mix({static_cast<const float*>(data), static_cast<std::size_t>(frames) * inputs}, piece.frames,
                         mixed_);
            mix_->write(*lane_, piece.frame, mixed_);
        }
        pa_stream_drop(stream_.get());
    }
}

}  // namespace lumacast::sound
