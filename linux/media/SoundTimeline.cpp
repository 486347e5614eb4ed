#include "linux/media/SoundTimeline.h"

#include <algorithm>
#include <array>
#include <cmath>

namespace lumacast::media {

namespace {

/// Drift beyond this is worked off, down to a tenth of it; nobody hears, or sees against the picture, what is below.
constexpr double kDriftSeconds = 0.002;
constexpr double kSmoothing = 0.05;
constexpr int kCorrectionSeconds = 2;

bool isSilence(const StereoSound& sound) {
    const auto isZero = [](float sample) { return sample == 0.0f; };
    return std::all_of(sound.planes[0].begin(), sound.planes[0].end(), isZero) &&
           std::all_of(sound.planes[1].begin(), sound.planes[1].end(), isZero);
}

}  // namespace

bool SoundTimeline::add(const AudioFormat& format, std::span<const std::uint8_t> bytes, std::size_t frameCount,
                        std::int64_t nanoseconds) {
    if (format_ != format && !adopt(format)) return false;
    incoming_.clear();
    readPcm(format, bytes, frameCount, incoming_);
    layOut(nanoseconds);
    return true;
}

bool SoundTimeline::add(const StereoSound& sound, int rate, std::int64_t nanoseconds) {
    AudioFormat format;
    format.sampleRate = rate;
    format.formatID = kAudioFormatLinearPCM;
    format.formatFlags = AudioFormat::kFlagFloat;
    format.bytesPerPacket = format.bytesPerFrame = 8;
    format.framesPerPacket = 1;
    format.channelsPerFrame = 2;
    format.bitsPerChannel = 32;
    if (format_ != format && !adopt(format)) return false;
    incoming_ = sound;
    layOut(nanoseconds);
    return true;
}

/// The buffer at hand.
void SoundTimeline::layOut(std::int64_t nanoseconds) {
    silentFrames_ = isSilence(incoming_) ? silentFrames_ + static_cast<std::int64_t>(incoming_.frames()) : 0;
    place(av_rescale_rnd(nanoseconds, sampleRate_, 1'000'000'000, AV_ROUND_NEAR_INF));
    if (incoming_.frames() > 0) resample(incoming_);
    take_();
}

void SoundTimeline::finish() {
    if (resampler_) emptyResampler();
}

void SoundTimeline::extend(std::int64_t nanoseconds, std::int64_t most) {
    const std::int64_t missing = av_rescale(nanoseconds, sampleRate_, 1'000'000'000) - placed_;
    if (origin_ && missing <= av_rescale(most, sampleRate_, 1'000'000'000)) fillHole(missing);
}

bool SoundTimeline::adopt(const AudioFormat& format) {
    if (!isReadable(format)) return false;
    if (resampler_) emptyResampler();
    SwrContext* context = nullptr;
    AVChannelLayout stereo = AV_CHANNEL_LAYOUT_STEREO;
    const int rate = static_cast<int>(std::lround(format.sampleRate));
    if (swr_alloc_set_opts2(&context, &stereo, AV_SAMPLE_FMT_FLTP, static_cast<int>(sampleRate_), &stereo,
                            AV_SAMPLE_FMT_FLTP, rate, 0, nullptr) < 0) {
        return false;
    }
    resampler_.reset(context);
    if (swr_init(context) < 0) return false;
    format_ = format;
    corrects_ = false;
    smoothedLate_ = 0;
    return true;
}

std::int64_t SoundTimeline::end() const { return placed_ + swr_get_delay(resampler_.get(), sampleRate_); }

/// Makes the next sound stand at `start`, frames after zero, or as near as makes no difference.
void SoundTimeline::place(std::int64_t start) {
    if (!origin_) {
        if (start < 0) dropIncoming(-start);
        if (incoming_.frames() == 0) return;
        origin_ = 0;
        return fillHole(start);  // the track begins with the movie, with silence
    }
    const std::int64_t jitter = kJitterNanoseconds * sampleRate_ / 1'000'000'000;
    const std::int64_t late = start - end();
    if (late > jitter) {
        emptyResampler();
        fillHole(start - placed_);
        smoothedLate_ = 0;
    } else if (late < -jitter) {
        dropIncoming(-late);
        smoothedLate_ = 0;
    } else {
        correctDrift(late);
    }
}

void SoundTimeline::fillHole(std::int64_t frames) {
    while (frames > 0) {
        const std::int64_t part = std::min(frames, sampleRate_);
        sound_.appendSilence(static_cast<std::size_t>(part));
        placed_ += part;
        frames -= part;
        take_();
    }
}

void SoundTimeline::correctDrift(std::int64_t late) {
    const double limit = kDriftSeconds * static_cast<double>(sampleRate_);
    smoothedLate_ += kSmoothing * (static_cast<double>(late) - smoothedLate_);
    const bool tooLate = std::abs(smoothedLate_) > limit;
    if (placed_ < nextCorrection_ || (!tooLate && !corrects_)) return;
    corrects_ = std::abs(smoothedLate_) > limit / 10;
    const int distance = static_cast<int>(sampleRate_) * kCorrectionSeconds;
    swr_set_compensation(resampler_.get(), corrects_ ? static_cast<int>(std::lround(smoothedLate_)) : 0, distance);
    nextCorrection_ = placed_ + sampleRate_ / 2;
}

/// Cuts off the beginning of the buffer at hand.
void SoundTimeline::dropIncoming(std::int64_t trackFrames) {
    const std::int64_t frames = av_rescale(trackFrames, std::llround(format_->sampleRate), sampleRate_);
    incoming_.dropFirst(std::min(static_cast<std::size_t>(frames), incoming_.frames()));
}

void SoundTimeline::emptyResampler() {
    resample(StereoSound());
    swr_init(resampler_.get());
    corrects_ = false;
}

/// Appends `input` at the track's rate; an empty input gets out what is still held.
void SoundTimeline::resample(const StereoSound& input) {
    const auto frames = static_cast<int>(input.frames());
    const int room = swr_get_out_samples(resampler_.get(), frames) + 64;
    const std::size_t before = sound_.frames();
    sound_.appendSilence(static_cast<std::size_t>(room));
    std::array<std::uint8_t*, 2> out{};
    std::array<const std::uint8_t*, 2> in{};
    for (std::size_t side = 0; side < 2; ++side) {
        out[side] = reinterpret_cast<std::uint8_t*>(sound_.planes[side].data() + before);
        in[side] = reinterpret_cast<const std::uint8_t*>(input.planes[side].data());
    }
    const int made =
        std::max(0, swr_convert(resampler_.get(), out.data(), room, frames > 0 ? in.data() : nullptr, frames));
    for (auto& plane : sound_.planes) plane.resize(before + static_cast<std::size_t>(made));
    placed_ += made;
}

}  // namespace lumacast::media
