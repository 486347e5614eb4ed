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

std::vector<Side> sidesOf(const std::vector<std::int32_t>& positions) {
    std::vector<Side> sides;
    for (const std::int32_t position : positions) {
        switch (position) {
            case PA_CHANNEL_POSITION_FRONT_LEFT:
            case PA_CHANNEL_POSITION_REAR_LEFT:
            case PA_CHANNEL_POSITION_FRONT_LEFT_OF_CENTER:
            case PA_CHANNEL_POSITION_SIDE_LEFT:
            case PA_CHANNEL_POSITION_TOP_FRONT_LEFT:
            case PA_CHANNEL_POSITION_TOP_REAR_LEFT: sides.push_back(Side::Left); break;
            case PA_CHANNEL_POSITION_FRONT_RIGHT:
            case PA_CHANNEL_POSITION_REAR_RIGHT:
            case PA_CHANNEL_POSITION_FRONT_RIGHT_OF_CENTER:
            case PA_CHANNEL_POSITION_SIDE_RIGHT:
            case PA_CHANNEL_POSITION_TOP_FRONT_RIGHT:
            case PA_CHANNEL_POSITION_TOP_REAR_RIGHT: sides.push_back(Side::Right); break;
            case PA_CHANNEL_POSITION_LFE: sides.push_back(Side::None); break;
            default: sides.push_back(Side::Middle);
        }
    }
    return sides;
}

}  // namespace

TappedStream::TappedStream(const PulseServer& server, const ListedPlayback& playback, std::shared_ptr<TapMix> mix,
                           std::function<void()> changed)
    : playback_(playback),
      mix_(std::move(mix)),
      changed_(std::move(changed)),
      mixDown_(sidesOf(playback.positions), mix_->channels()),
      lane_(mix_->addLane()),
      position_(mix_->rate()) {
    pa_sample_spec format{};
    format.format = PA_SAMPLE_FLOAT32NE;
    format.rate = static_cast<std::uint32_t>(std::lround(mix_->rate()));
    format.channels = static_cast<std::uint8_t>(playback_.positions.size());
    // The stream's own channels in its own order: the server mixes nothing down.
    pa_channel_map map{};
    map.channels = format.channels;
    for (std::uint8_t channel = 0; channel < map.channels; ++channel)
        map.map[channel] = static_cast<pa_channel_position_t>(playback_.positions[channel]);
    const PropertyListHandle properties(pa_proplist_new());
    // PipeWire: this stream or none, never another one in its place, from the beginning and later.
    pa_proplist_sets(properties.get(), "node.dont-reconnect", "true");
    pa_proplist_sets(properties.get(), "node.dont-fallback", "true");
    stream_.reset(pa_stream_new_with_proplist(&server.context, "tap", &format, &map, properties.get()));
    if (!stream_ || pa_stream_set_monitor_stream(stream_.get(), playback_.index) < 0) {
        end();
        return;
    }
    pa_stream_set_state_callback(
        stream_.get(), [](pa_stream*, void* self) { static_cast<TappedStream*>(self)->stateChanged(); }, this);
    pa_stream_set_read_callback(
        stream_.get(), [](pa_stream*, std::size_t, void* self) { static_cast<TappedStream*>(self)->hear(); }, this);
    // Where it hangs now nobody has looked at.
    pa_stream_set_moved_callback(
        stream_.get(), [](pa_stream*, void* self) { static_cast<TappedStream*>(self)->distrust(); }, this);
    pa_buffer_attr buffer{};
    buffer.maxlength = static_cast<std::uint32_t>(pa_usec_to_bytes(static_cast<pa_usec_t>(kMostKeptSeconds * 1e6), &format));
    buffer.fragsize = static_cast<std::uint32_t>(pa_usec_to_bytes(static_cast<pa_usec_t>(kFragmentSeconds * 1e6), &format));
    buffer.tlength = buffer.prebuf = buffer.minreq = static_cast<std::uint32_t>(-1);
    constexpr int kFlags = PA_STREAM_DONT_MOVE | PA_STREAM_ADJUST_LATENCY | PA_STREAM_AUTO_TIMING_UPDATE |
                           PA_STREAM_INTERPOLATE_TIMING | PA_STREAM_DONT_INHIBIT_AUTO_SUSPEND;
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
        // So that the first sound can be placed. It waits in the library until then.
        if (pa_operation* const operation = pa_stream_update_timing_info(stream_.get(), [](pa_stream*, int, void* self) {
                static_cast<TappedStream*>(self)->hear();
            }, this))
            pa_operation_unref(operation);
        changed_();
    } else if (!PA_STREAM_IS_GOOD(state)) {
        end();
        changed_();
    }
}

void TappedStream::hear() {
    if (!isReady()) return;
    while (true) {
        // When the first frame that was not taken was heard: so long ago, or in so long.
        pa_usec_t latency = 0;
        int isAhead = 0;
        if (pa_stream_get_latency(stream_.get(), &latency, &isAhead) < 0) return;
        const void* data = nullptr;
        std::size_t bytes = 0;
        if (pa_stream_peek(stream_.get(), &data, &bytes) < 0 || bytes == 0) return;
        const auto away = static_cast<std::int64_t>(std::min<pa_usec_t>(latency, 3'600'000'000u)) * 1000;
        const HostTime now = LinuxClock::currentHostTime();
        const HostTime heard{now.nanoseconds + (isAhead ? away : -away)};
        const std::size_t frameBytes = playback_.positions.size() * sizeof(float);
        const auto frames = static_cast<std::int64_t>(bytes / frameBytes);
        const auto piece = position_.place(mix_->frameAt(heard), frames);
        // Without data it is a hole: time passes, and there is silence.
        if (data) {
            mixDown_.mix({static_cast<const float*>(data), static_cast<std::size_t>(frames) * playback_.positions.size()},
                         piece.frames, mixed_);
            mix_->write(*lane_, piece.frame, mixed_);
        }
        pa_stream_drop(stream_.get());
    }
}

}  // namespace lumacast::sound
