#include "extensions/live-push/EncoderLane.h"

#include <algorithm>
#include <utility>
#include <vector>

namespace lumacast::extensions {

namespace {

constexpr std::int64_t kSoundBitRate = 128'000;
constexpr std::int64_t kSecond = 1'000'000'000;

std::int64_t nanosecondsOf(const SampleTiming& timing) {
    return av_rescale(timing.presentation.value, kSecond, timing.presentation.timescale);
}

AvOwned<AVCodecParameters> parametersOf(const AVCodecContext& encoder) {
    AvOwned<AVCodecParameters> parameters(avcodec_parameters_alloc());
    if (parameters && avcodec_parameters_from_context(parameters.get(), &encoder) < 0) parameters.reset();
    return parameters;
}

}  // namespace

EncoderLane::EncoderLane(PushSettings settings, Outlet outlet)
    : settings_(std::move(settings)), outlet_(std::move(outlet)), thread_([this] { run(); }) {}

EncoderLane::~EncoderLane() {
    finish();
}

void EncoderLane::frame(extension::Frame frame) {
    std::optional<extension::Frame> older(std::move(frame));
    bool isOneLeftOut = false;
    {
        const std::lock_guard lock(mutex_);
        frame_.swap(older);
        isOneLeftOut = older.has_value();
        changed_.notify_all();
    }
    if (isOneLeftOut) outlet_.leftOut(1);
}

void EncoderLane::sound(extension::Sound sound) {
    sound.completion = nullptr;  // the bytes are ours
    const std::lock_guard lock(mutex_);
    sounds_.push_back(std::move(sound));
    if (sounds_.size() > kMostSounds) sounds_.pop_front();
    changed_.notify_all();
}

void EncoderLane::finish() {
    {
        const std::lock_guard lock(mutex_);
        isEnding_ = true;
        changed_.notify_all();
    }
    if (thread_.joinable()) thread_.join();
}

void EncoderLane::run() {
    for (;;) {
        std::optional<extension::Frame> frame;
        std::deque<extension::Sound> sounds;
        {
            std::unique_lock lock(mutex_);
            changed_.wait(lock, [this] { return isEnding_ || frame_ || !sounds_.empty(); });
            if (!frame_ && sounds_.empty()) break;
            frame.swap(frame_);
            sounds.swap(sounds_);
        }
        if (frame) encode(std::move(*frame));
        for (const extension::Sound& sound : sounds) encode(sound);
    }
    encodeEnd();
}

bool EncoderLane::begin(const extension::Frame& frame) {
    const auto size = PictureConverter::sizeWithin(frame.plane->width(), frame.plane->height(), frame.orientation,
                                                   settings_.width, settings_.height);
    converter_ = std::make_unique<PictureConverter>(size.width, size.height);
    pictures_ = std::make_unique<PictureEncoder>(size.width, size.height, settings_.bitRate);
    sound_ = std::make_unique<AacEncoder>(kSoundRate, kSoundBitRate, 0);
    StreamTracks tracks;
    if (pictures_->error().empty() && sound_->error().empty()) {
        tracks.video = parametersOf(*pictures_->context());
        tracks.sound = parametersOf(*sound_->context());
    }
    if (!tracks.video || !tracks.sound) {
        hasFailed_ = true;
        outlet_.failed(pictures_->error().empty() ? sound_->error() : pictures_->error());
        return false;
    }
    tracks.videoBase = {1, PictureEncoder::kTicksPerSecond};
    tracks.soundBase = {1, kSoundRate};
    zero_ = nanosecondsOf(frame.timing);
    outlet_.begin(std::move(tracks));
    return true;
}

void EncoderLane::encode(extension::Frame frame) {
    if (hasFailed_ || (!zero_ && !begin(frame))) return;
    const std::int64_t nanoseconds = nanosecondsOf(frame.timing) - *zero_;
    const std::int64_t ticks = av_rescale(nanoseconds, PictureEncoder::kTicksPerSecond, kSecond);
    if (ticks <= lastTicks_) return;
    lastTicks_ = ticks;
    const AvOwned<AVFrame> picture = converter_->convert(*frame.plane, frame.orientation);
    frame = {};  // the daemon has its plane again while the picture is encoded
    if (!picture) return;
    for (auto& packet : pictures_->encode(*picture, ticks, wantsKeyFrame_.exchange(false)))
        outlet_.packet({std::move(packet), true});
    sendSound(mixer_.take(av_rescale(nanoseconds, kSoundRate, kSecond)));
}

void EncoderLane::encode(const extension::Sound& sound) {
    if (hasFailed_ || !zero_) return;
    const bool isApplication = sound.source == extension::Sound::Source::Application;
    const std::int64_t start = av_rescale(nanosecondsOf(sound.timing) - *zero_, kSoundRate, kSecond);
    const StereoSound samples = (isApplication ? application_ : microphone_).read(sound);
    mixer_.add(isApplication ? 0 : 1, samples, start);
    sendSound(mixer_.take(start + static_cast<std::int64_t>(samples.size())));
}

void EncoderLane::sendSound(const StereoSound& sound) {
    if (sound.size() == 0) return;
    for (auto& packet : sound_->encode(sound)) outlet_.packet({std::move(packet), false});
}

void EncoderLane::encodeEnd() {
    if (hasFailed_ || !zero_) return;
    sendSound(mixer_.takeAll(av_rescale(lastTicks_, kSoundRate, PictureEncoder::kTicksPerSecond)));
    for (auto& packet : sound_->finish()) outlet_.packet({std::move(packet), false});
}

}  // namespace lumacast::extensions
