#include "linux/media/SoundTrack.h"

#include <algorithm>
#include <utility>

namespace lumacast::media {

namespace {

/// How much silence may be missing at the end: a tap's longest piece, and what it is late by.
constexpr std::int64_t kLatestSilence = 2'000'000'000;

}  // namespace

std::optional<Error> movieError(mp4::MovieError error) {
    switch (error) {
        case mp4::MovieError::none:
        case mp4::MovieError::badTime:
        case mp4::MovieError::badSample: return std::nullopt;
        case mp4::MovieError::tooLong: return systemError(EFBIG);
        case mp4::MovieError::empty: return systemError(ENODATA);
        case mp4::MovieError::sinkFailed: return systemError(EIO);
        default: return systemError(EPROTO);
    }
}

SoundTrack::SoundTrack(const AudioTrackSettings& settings, std::unique_ptr<AudioEncoder> encoder,
                       mp4::MovieBoxWriter& movie)
    : encoder_(std::move(encoder)), movie_(movie), timeline_(settings.sampleRate, [this] { encode(Rest::Keep); }) {}

std::variant<std::unique_ptr<SoundTrack>, Error> SoundTrack::open(const AudioTrackSettings& settings, std::string name,
                                                                  mp4::MovieBoxWriter& movie) {
    auto opened = AudioEncoder::open(settings);
    if (auto* const error = std::get_if<Error>(&opened)) return *error;
    std::unique_ptr<SoundTrack> sound(new SoundTrack(settings, std::move(std::get<0>(opened)), movie));
    const auto header = sound->encoder_->header();
    mp4::AudioTrackDescription description;
    description.sampleRate = static_cast<std::uint32_t>(settings.sampleRate);
    description.channels = static_cast<std::uint16_t>(settings.channels);
    description.audioSpecificConfig.assign(header.begin(), header.end());
    description.primingFrames = sound->encoder_->primingFrames();
    description.bitRate = static_cast<std::uint32_t>(settings.bitRate);
    description.name = std::move(name);
    const auto track = movie.addAudioTrack(std::move(description));
    if (!track) return systemError(EPROTO);
    sound->track_ = *track;
    return sound;
}

std::optional<Error> SoundTrack::add(const SampleBuffer& sample, std::int64_t nanoseconds) {
    if (!sample.data() || sample.sampleCount() <= 0) return std::nullopt;
    timeline_.add(sample.format().audio, *sample.data(), static_cast<std::size_t>(sample.sampleCount()), nanoseconds);
    return error_;
}

std::optional<Error> SoundTrack::add(const StereoSound& sound, int rate, std::int64_t nanoseconds) {
    if (!timeline_.add(sound, rate, nanoseconds)) return systemError(ENOTSUP);
    return error_;
}

std::optional<Error> SoundTrack::finish(std::optional<std::int64_t> end) {
    if (!timeline_.origin()) return error_;
    timeline_.finish();
    if (end && isSilent()) timeline_.extend(*end, kLatestSilence);
    encode(Rest::Keep);
    total_ = encoder_->primingFrames() + encoded_ + static_cast<std::int64_t>(timeline_.sound().frames());
    encode(Rest::Encode);
    const auto error = encoder_->drain([this](auto packet) { deliver(packet); });
    return error_ ? error_ : error;
}

void SoundTrack::encode(Rest rest) {
    StereoSound& sound = timeline_.sound();
    const std::size_t packet = encoder_->packetFrames();
    std::size_t first = 0;
    while (!error_ && first < sound.frames() && (rest == Rest::Encode || sound.frames() - first >= packet)) {
        if (const auto error = encoder_->encode(sound, first, [this](auto bytes) { deliver(bytes); })) error_ = error;
        first += std::min(packet, sound.frames() - first);
    }
    encoded_ += static_cast<std::int64_t>(first);
    sound.dropFirst(first);
}

void SoundTrack::deliver(std::span<const std::uint8_t> packet) {
    const std::int64_t length = std::min<std::int64_t>(encoder_->packetFrames(), total_ - delivered_);
    if (length <= 0) return;  // the encoder fills its last packets up with silence
    mp4::SampleInfo info;
    info.pts = *timeline_.origin() - encoder_->primingFrames() + delivered_;
    info.duration = static_cast<std::uint32_t>(length);
    info.isSync = true;
    if (const auto error = movieError(movie_.addSample(track_, info, packet)); error && !error_) error_ = error;
    delivered_ += length;
}

}  // namespace lumacast::media
