#include "extensions/hls-clips/Segmenter.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace lumacast::extensions {

namespace {

constexpr int kUsualRate = 48'000;
constexpr std::int64_t kSoundBitRate = 128'000;
/// Sound that ends this close to the last picture ends the clip, so that it goes on in the next one without a hole.
constexpr std::int64_t kSoundEndsClip = kTicksPerSecond / 10;

std::int64_t samplesAt(std::int64_t ticks, int rate) {
    return av_rescale(ticks, rate, kTicksPerSecond);
}

}  // namespace

std::vector<Segment> Segmenter::add(const Fd& movie, bool isLast, std::string& error) {
    ClipMedia media;
    error = readClip(movie, encoder_ ? encoder_->sampleRate() : 0, media);
    if (!error.empty() || !accept(media, error)) {
        leaveOut();
        return {};
    }
    const std::int64_t start = position_, end = endOf(media);
    for (const auto& picture : media.pictures) {
        picture->pts += start;
        picture->dts += start;
    }
    encodeSound(media, end, isLast);
    std::vector<Segment> segments;
    const std::vector<std::size_t> cuts = cutsOf(media, start + end);
    for (std::size_t at = 0; at + 1 < cuts.size(); ++at) {
        const bool isEnd = at + 2 == cuts.size();
        const std::int64_t until = isEnd ? start + end : media.pictures[cuts[at + 1]]->pts;
        auto segment = write(media, cuts[at], cuts[at + 1], until, isEnd && isLast, error);
        if (segment)
            segments.push_back(std::move(*segment));
        else
            leaveOut();
    }
    position_ = start + end;
    return segments;
}

/// Whether there is something to show; makes the encoder when this is the first such clip.
bool Segmenter::accept(const ClipMedia& media, std::string& error) {
    if (!media.video || media.pictures.empty()) {
        error = "a clip without pictures";
        return false;
    }
    if (!(media.pictures.front()->flags & AV_PKT_FLAG_KEY)) {
        error = "a clip that does not begin with a key frame";
        return false;
    }
    if (encoder_) return true;
    // The stream begins late enough for the first picture to be decoded after its zero.
    position_ = std::max<std::int64_t>(0, -media.pictures.front()->dts);
    const int rate = media.soundRate > 0 ? media.soundRate : kUsualRate;
    auto encoder = std::make_unique<AacEncoder>(rate, kSoundBitRate, samplesAt(position_, rate));
    error = encoder->error();
    if (!error.empty()) return false;
    encoder_ = std::move(encoder);
    return true;
}

/// When the clip ends, in ticks after its beginning.
std::int64_t Segmenter::endOf(const ClipMedia& media) const {
    std::int64_t lastPicture = 0;
    for (const auto& picture : media.pictures) lastPicture = std::max(lastPicture, picture->pts);
    const std::int64_t pictureEnd = std::max(media.pictureEnd, lastPicture + 1);
    const std::int64_t soundEnd =
        av_rescale(static_cast<std::int64_t>(media.sound.size()), kTicksPerSecond, encoder_->sampleRate());
    const bool soundEndsIt = soundEnd > lastPicture && std::abs(soundEnd - pictureEnd) <= kSoundEndsClip;
    return soundEndsIt ? soundEnd : pictureEnd;
}

void Segmenter::encodeSound(const ClipMedia& media, std::int64_t end, bool isLast) {
    // Counted from the stream's beginning, so that no rounding adds up.
    const std::int64_t wanted = samplesAt(position_ + end, encoder_->sampleRate()) - encoder_->position();
    StereoSound sound = media.sound;
    sound.resize(static_cast<std::size_t>(std::max<std::int64_t>(0, wanted)));
    std::ranges::move(encoder_->encode(sound), std::back_inserter(sounds_));
    if (isLast) std::ranges::move(encoder_->finish(), std::back_inserter(sounds_));
}

/// Where segments begin, as places in the pictures, and the end of them.
std::vector<std::size_t> Segmenter::cutsOf(const ClipMedia& media, std::int64_t end) const {
    std::vector<std::size_t> cuts{0};
    std::size_t lastKey = 0;
    for (std::size_t at = 1; at <= media.pictures.size(); ++at) {
        const bool isEnd = at == media.pictures.size();
        if (!isEnd && !(media.pictures[at]->flags & AV_PKT_FLAG_KEY)) continue;
        const std::int64_t time = isEnd ? end : media.pictures[at]->pts;
        if (time - media.pictures[cuts.back()]->pts > longest_ && lastKey > cuts.back()) cuts.push_back(lastKey);
        lastKey = at;
    }
    cuts.push_back(media.pictures.size());
    return cuts;
}

std::optional<Segment> Segmenter::write(ClipMedia& media, std::size_t from, std::size_t to, std::int64_t end,
                                        bool takesAllSound, std::string& error) {
    SegmentMedia parts;
    parts.video = media.video.get();
    parts.sound = encoder_->context();
    const auto begin = media.pictures.begin();
    const std::int64_t start = media.pictures[from]->pts;
    parts.pictures.assign(std::make_move_iterator(begin + static_cast<std::ptrdiff_t>(from)),
                          std::make_move_iterator(begin + static_cast<std::ptrdiff_t>(to)));
    // The last one is shown until the next segment's first.
    if (parts.pictures.back()->pts < end) parts.pictures.back()->duration = end - parts.pictures.back()->pts;
    const std::int64_t soundEnd = samplesAt(end, encoder_->sampleRate());
    const auto later =
        std::ranges::find_if(sounds_, [&](const auto& sound) { return !takesAllSound && sound->pts >= soundEnd; });
    parts.sounds.assign(std::make_move_iterator(sounds_.begin()), std::make_move_iterator(later));
    sounds_.erase(sounds_.begin(), later);
    SegmentBytes bytes;
    error = writeSegment(parts, ++segments_, bytes);
    if (!error.empty()) return std::nullopt;
    return Segment{std::move(bytes.init), std::move(bytes.media), end - start, std::exchange(isDiscontinuous_, false)};
}

}  // namespace lumacast::extensions
