#include "linux/media/MixInput.h"

#include <algorithm>
#include <array>
#include <utility>

namespace lumacast::media {

namespace {

/// Stamps of a track are counted in frames: what is nearer is rounding.
constexpr std::int64_t kJitterFrames = 8;

}  // namespace

MixInput::MixInput(std::unique_ptr<TrackDecoder> decoder, float volume, int sampleRate, std::int64_t zero)
    : decoder_(std::move(decoder)), volume_(volume), sampleRate_(sampleRate), zero_(zero) {}

std::optional<Error> MixInput::addTo(StereoSound& mix, std::int64_t position) {
    const std::int64_t end = position + static_cast<std::int64_t>(mix.frames());
    if (const auto error = decodeUpTo(end)) return error;
    for (const Run& run : runs_) {
        const std::int64_t first = std::max(run.start, position), last = std::min(run.end(), end);
        for (std::int64_t at = first; at < last; ++at) {
            for (std::size_t side = 0; side < 2; ++side) {
                mix.planes[side][static_cast<std::size_t>(at - position)] +=
                    volume_ * run.sound.planes[side][static_cast<std::size_t>(at - run.start)];
            }
        }
    }
    while (!runs_.empty() && runs_.front().end() <= end && (runs_.size() > 1 || isAtEnd_)) runs_.pop_front();
    if (!runs_.empty() && runs_.front().start < end) {
        Run& run = runs_.front();
        const std::size_t count = std::min(static_cast<std::size_t>(end - run.start), run.sound.frames());
        run.sound.dropFirst(count);
        run.start += static_cast<std::int64_t>(count);
    }
    return std::nullopt;
}

std::optional<Error> MixInput::decodeUpTo(std::int64_t end) {
    while (!isAtEnd_ && (runs_.empty() || runs_.back().end() < end)) {
        if (!runs_.empty() && runs_.back().start >= end) break;
        auto next = decoder_->next();
        if (auto* const error = std::get_if<Error>(&next)) return *error;
        const AVFrame* const packet = std::get<0>(next);
        if (packet) {
            if (const auto error = take(*packet)) return error;
        } else {
            if (resampler_ && !runs_.empty()) resample(nullptr);
            isAtEnd_ = true;
        }
    }
    return std::nullopt;
}

std::optional<Error> MixInput::adopt(const AVFrame& packet) {
    const bool isKnown = resampler_ && packet.sample_rate == rate_ && packet.ch_layout.nb_channels == channels_ &&
                         packet.format == format_;
    if (isKnown) return std::nullopt;
    if (packet.sample_rate < 4000 || packet.sample_rate > 384'000) return systemError(EPROTO);
    if (resampler_ && !runs_.empty()) resample(nullptr);
    rate_ = packet.sample_rate;
    channels_ = packet.ch_layout.nb_channels;
    format_ = packet.format;
    AVChannelLayout mono = AV_CHANNEL_LAYOUT_MONO, stereo = AV_CHANNEL_LAYOUT_STEREO, in = packet.ch_layout;
    SwrContext* context = nullptr;
    // One channel is heard on both sides as loud as it is: the library's own mixing would turn it down.
    AVChannelLayout* const out = channels_ == 1 ? &mono : &stereo;
    const int error = swr_alloc_set_opts2(&context, out, AV_SAMPLE_FMT_FLTP, sampleRate_, &in,
                                          static_cast<AVSampleFormat>(packet.format), rate_, 0, nullptr);
    resampler_.reset(context);
    if (error < 0) return avError(error);
    const int opened = swr_init(context);
    return opened < 0 ? std::optional(avError(opened)) : std::nullopt;
}

std::optional<Error> MixInput::take(const AVFrame& packet) {
    if (const auto error = adopt(packet)) return error;
    const std::int64_t stamp =
        av_rescale(packet.pts, sampleRate_, decoder_->timescale()) - av_rescale(zero_, sampleRate_, 1'000'000'000);
    const std::int64_t expected = runs_.empty() ? INT64_MIN / 2
                                                : runs_.back().end() + swr_get_delay(resampler_.get(), sampleRate_);
    if (stamp - expected > kJitterFrames || stamp - expected < -kJitterFrames) {
        if (!runs_.empty()) {
            resample(nullptr);
            swr_init(resampler_.get());
            if (stamp < runs_.back().end()) return systemError(EPROTO);  // two sounds at one time
        }
        runs_.push_back({stamp, {}});
    }
    resample(&packet);
    return std::nullopt;
}

/// Appends to the last run; null gets out what is still held.
void MixInput::resample(const AVFrame* packet) {
    StereoSound& sound = runs_.back().sound;
    // The last packet of a track is cut to what of it is sound.
    int frames = packet ? packet->nb_samples : 0;
    if (packet && packet->pkt_duration > 0) {
        const std::int64_t stated = av_rescale(packet->pkt_duration, rate_, decoder_->timescale());
        frames = static_cast<int>(std::min<std::int64_t>(frames, std::max<std::int64_t>(stated, 0)));
    }
    const int room = swr_get_out_samples(resampler_.get(), frames) + 64;
    const std::size_t before = sound.frames();
    sound.appendSilence(static_cast<std::size_t>(room));
    std::array<std::uint8_t*, 2> out{};
    for (std::size_t side = 0; side < 2; ++side) {
        out[side] = reinterpret_cast<std::uint8_t*>(sound.planes[side].data() + before);
    }
    const auto** const in = packet ? const_cast<const std::uint8_t**>(packet->extended_data) : nullptr;
    const int made = std::max(0, swr_convert(resampler_.get(), out.data(), room, in, frames));
    for (auto& plane : sound.planes) plane.resize(before + static_cast<std::size_t>(made));
    if (channels_ == 1) {
        std::copy(sound.planes[0].begin() + static_cast<std::ptrdiff_t>(before), sound.planes[0].end(),
                  sound.planes[1].begin() + static_cast<std::ptrdiff_t>(before));
    }
}

}  // namespace lumacast::media
