#include "linux/media/EncodingExport.h"

#include <algorithm>
#include <cmath>
#include <memory>
#include <utility>
#include <vector>

#include "linux/media/MixInput.h"
#include "linux/media/PictureReencoder.h"
#include "linux/media/SoundLimiter.h"
#include "linux/media/SoundTrack.h"
#include "linux/media/mp4/Ticks.h"

namespace lumacast::media {

namespace {

constexpr std::int64_t kSecond = 1'000'000'000;
constexpr std::int64_t kLongest = 24 * 3600 * kSecond;
constexpr std::size_t kMostSoundTracks = 7;
/// Sound that a decoder wants before the first sound that is heard.
constexpr std::int64_t kSoundLead = 70'000'000;
constexpr std::size_t kBlock = 1024;  ///< frames mixed at a time
constexpr float kLoudest = 16;

std::optional<Error> copyError(mp4::MovieError error) {
    if (error == mp4::MovieError::none) return std::nullopt;
    return movieError(error).value_or(systemError(EPROTO));  // what a recording may leave out, a copy must not
}

/// A sound track that goes into the new movie as it is.
class SoundCopy final {
public:
    SoundCopy(std::unique_ptr<MovieSource> source, std::size_t track, std::int64_t zero)
        : source_(std::move(source)), track_(track), zero_(zero) {}

    bool declare(mp4::MovieBoxWriter& movie) {
        const auto id = movie.addAudioTrack(source_->describeAudio(track_));
        if (id) id_ = *id;
        return id.has_value();
    }
    /// What begins before `end`, nanoseconds of the movie.
    std::optional<Error> copyUpTo(std::int64_t end, mp4::MovieBoxWriter& movie, const ExportState& state) {
        const auto timescale = static_cast<std::uint32_t>(source_->tracks()[track_].timescale);
        while (!isAtEnd_ && reached_ < end && !state.isCancelled()) {
            auto next = source_->read();
            if (auto* const error = std::get_if<Error>(&next)) return *error;
            const auto& sample = std::get<0>(next);
            isAtEnd_ = !sample.has_value();
            if (isAtEnd_) break;
            reached_ = mp4::rescale(sample->stamp, timescale, mp4::kNanosecondTimescale);
            if (sample->duration <= 0 || sample->duration > UINT32_MAX) return systemError(EPROTO);
            const std::int64_t sampleEnd =
                mp4::rescale(sample->stamp + sample->duration, timescale, mp4::kNanosecondTimescale);
            if (sampleEnd <= zero_ - kSoundLead) continue;
            const std::int64_t stamp = sample->stamp - mp4::rescale(zero_, mp4::kNanosecondTimescale, timescale);
            const mp4::SampleInfo info{stamp, static_cast<std::uint32_t>(sample->duration), true};
            if (const auto error = copyError(movie.addSample(id_, info, sample->bytes))) return error;
        }
        return std::nullopt;
    }

private:
    const std::unique_ptr<MovieSource> source_;
    const std::size_t track_;
    const std::int64_t zero_;
    mp4::TrackId id_{};
    std::int64_t reached_ = INT64_MIN;
    bool isAtEnd_ = false;
};

/// One export while it runs. The picture leads; sound follows up to the last picture that was written, so that the two
/// lie side by side in the file.
class Encoding final {
public:
    Encoding(const MovieSource& source, const ExportPlan& plan, ExportSink& sink, ExportSpan span, ExportState& state)
        : source_(source), plan_(plan), span_(span), state_(state), movie_(sink, options()) {}

    std::optional<Error> run() {
        if (span_.end - span_.start > kLongest) return systemError(EFBIG);
        if (const auto error = open()) return error;
        if (const auto error = movieError(movie_.start())) return error;
        // What lies before the movie's zero leads: with a fragment written, a track can't begin there any more.
        if (const auto error = soundUpTo(1)) return error;
        if (const auto error = encodePictures()) return error;
        if (const auto error = soundUpTo(span_.end - span_.start)) return error;
        if (const auto error = finishSound()) return error;
        if (state_.isCancelled()) return systemError(ECANCELED);
        return movieError(movie_.finish(lastPictureEnd_, span_.end - span_.start));
    }

private:
    static mp4::MovieOptions options() {
        mp4::MovieOptions options;
        options.presentationStart = 0;
        options.purpose = mp4::MoviePurpose::copy;
        return options;
    }

    std::optional<Error> open() {
        const auto& tracks = source_.tracks();
        std::vector<std::size_t> sounds;
        for (std::size_t i = 0; i < tracks.size(); ++i) {
            if (!tracks[i].isVideo) {
                sounds.push_back(i);
            } else {
                if (pictures_) return systemError(ENOTSUP);
                if (const auto error = openPictures(i)) return error;
            }
        }
        if (sounds.size() > kMostSoundTracks) return systemError(ENOTSUP);
        return plan_.mix ? openMix(sounds) : openCopies(sounds);
    }

    std::optional<Error> openPictures(std::size_t track) {
        auto decoder = TrackDecoder::open(plan_.source, track, span_.start);
        if (auto* const error = std::get_if<Error>(&decoder)) return *error;
        pictures_ = std::move(std::get<0>(decoder));
        auto encoder = PictureReencoder::open(source_, track, movie_);
        if (auto* const error = std::get_if<Error>(&encoder)) return *error;
        encoder_ = std::move(std::get<0>(encoder));
        return std::nullopt;
    }

    std::optional<Error> openCopies(const std::vector<std::size_t>& tracks) {
        for (const std::size_t track : tracks) {
            auto opened = MovieSource::open(plan_.source);
            if (auto* const error = std::get_if<Error>(&opened)) return *error;
            auto source = std::move(std::get<0>(opened));
            if (track >= source->tracks().size()) return systemError(EPROTO);
            source->readOnly(track);
            if (const auto error = source->seek(span_.start - kSoundLead)) return error;
            copies_.push_back(std::make_unique<SoundCopy>(std::move(source), track, span_.start));
            if (!copies_.back()->declare(movie_)) return systemError(ENOTSUP);
        }
        return std::nullopt;
    }

    std::optional<Error> openMix(const std::vector<std::size_t>& tracks) {
        AudioTrackSettings settings;
        std::vector<std::pair<std::size_t, float>> mixed;
        for (const std::size_t track : tracks) {
            const auto& inputs = plan_.mix->inputParameters;
            const auto named = std::find_if(inputs.begin(), inputs.end(), [&](const AudioMixInputParameters& input) {
                return input.trackID == source_.tracks()[track].id;
            });
            if (named == inputs.end()) continue;
            mixed.emplace_back(track, std::isfinite(named->volume) ? std::clamp(named->volume, 0.0f, kLoudest) : 1.0f);
            // One rate for all is kept; else the usual one of movies.
            const int rate = source_.codecOf(track).sample_rate;
            settings.sampleRate = mixed.size() == 1 || rate == settings.sampleRate ? rate : 48000;
        }
        if (mixed.empty()) return std::nullopt;
        sampleRate_ = settings.sampleRate;
        const std::string name = mixed.size() == 1 ? source_.describeAudio(mixed.front().first).name : "Sound";
        auto opened = SoundTrack::open(settings, name, movie_);
        if (auto* const error = std::get_if<Error>(&opened)) return *error;
        sound_ = std::move(std::get<0>(opened));
        for (const auto& [track, volume] : mixed) {
            auto decoder = TrackDecoder::open(plan_.source, track, span_.start - kSoundLead);
            if (auto* const error = std::get_if<Error>(&decoder)) return *error;
            inputs_.push_back(std::make_unique<MixInput>(std::move(std::get<0>(decoder)), volume, sampleRate_,
                                                         span_.start));
        }
        const bool staysAsItIs = mixed.size() == 1 && mixed.front().second <= 1;
        if (!staysAsItIs) limiter_ = std::make_unique<SoundLimiter>(sampleRate_);
        return std::nullopt;
    }

    std::optional<Error> encodePictures() {
        if (!pictures_) return std::nullopt;
        const auto timescale = static_cast<std::uint32_t>(pictures_->timescale());
        const std::int64_t zero = mp4::rescale(span_.start, mp4::kNanosecondTimescale, timescale);
        const std::int64_t end = mp4::rescale(span_.end, mp4::kNanosecondTimescale, timescale);
        for (;;) {
            if (state_.isCancelled()) return systemError(ECANCELED);
            auto next = pictures_->next();
            if (auto* const error = std::get_if<Error>(&next)) return *error;
            const AVFrame* const picture = std::get<0>(next);
            if (!picture || picture->pts >= end) break;
            const std::int64_t pictureEnd = picture->pts + picture->pkt_duration;
            // The picture on show at the beginning begins with it; what is over by then is only decoded from.
            if (picture->pts < zero && pictureEnd <= zero) continue;
            const std::int64_t stamp = std::max<std::int64_t>(picture->pts - zero, 0);
            lastPictureEnd_ = std::max(stamp + 1, pictureEnd - zero);
            if (const auto error = encoder_->add(*picture, stamp)) return error;
            if (const auto error = soundAlongPictures(timescale)) return error;
        }
        if (const auto error = encoder_->finish()) return error;
        return soundAlongPictures(timescale);
    }

    std::optional<Error> soundAlongPictures(std::uint32_t timescale) {
        if (!encoder_->written()) return std::nullopt;
        const std::int64_t reached = mp4::rescale(*encoder_->written(), timescale, mp4::kNanosecondTimescale);
        state_.advance(static_cast<double>(reached) / static_cast<double>(span_.end - span_.start));
        return soundUpTo(std::min(reached, span_.end - span_.start));
    }

    /// Nanoseconds of the new movie.
    std::optional<Error> soundUpTo(std::int64_t end) {
        for (const auto& copy : copies_) {
            if (const auto error = copy->copyUpTo(end + span_.start, movie_, state_)) return error;
        }
        const auto hasEnded = [](const auto& input) { return input->hasEnded(); };
        while (sound_ && !std::all_of(inputs_.begin(), inputs_.end(), hasEnded) &&
               av_rescale(mixed_, kSecond, sampleRate_) < end) {
            if (state_.isCancelled()) return systemError(ECANCELED);
            if (const auto error = mixBlock()) return error;
        }
        return std::nullopt;
    }

    std::optional<Error> mixBlock() {
        block_.clear();
        block_.appendSilence(kBlock);
        for (const auto& input : inputs_) {
            if (const auto error = input->addTo(block_, mixed_)) return error;
        }
        mixed_ += kBlock;
        if (!limiter_) return deliver(block_);
        ready_.clear();
        limiter_->add(block_, ready_);
        return deliver(ready_);
    }

    std::optional<Error> deliver(const StereoSound& sound) {
        const std::int64_t at = av_rescale(delivered_, kSecond, sampleRate_);
        delivered_ += static_cast<std::int64_t>(sound.frames());
        return sound_->add(sound, sampleRate_, at);
    }

    std::optional<Error> finishSound() {
        if (!sound_) return std::nullopt;
        if (limiter_) {
            ready_.clear();
            limiter_->finish(ready_);
            if (const auto error = deliver(ready_)) return error;
        }
        return sound_->finish();
    }

    const MovieSource& source_;
    const ExportPlan& plan_;
    const ExportSpan span_;
    ExportState& state_;
    mp4::MovieBoxWriter movie_;
    std::unique_ptr<TrackDecoder> pictures_;
    std::unique_ptr<PictureReencoder> encoder_;
    std::int64_t lastPictureEnd_ = 0;  ///< ticks
    std::vector<std::unique_ptr<SoundCopy>> copies_;
    std::vector<std::unique_ptr<MixInput>> inputs_;
    std::unique_ptr<SoundLimiter> limiter_;
    std::unique_ptr<SoundTrack> sound_;
    StereoSound block_, ready_;
    int sampleRate_ = 0;
    std::int64_t mixed_ = 0, delivered_ = 0;  ///< frames
};

}  // namespace

ExportResult exportEncoded(const MovieSource& source, const ExportPlan& plan, ExportSink& sink, ExportSpan span,
                           ExportState& state) {
    auto error = Encoding(source, plan, sink, span, state).run();
    if (state.isCancelled() && error) return {ExportStatus::Cancelled, systemError(ECANCELED)};
    return {error ? ExportStatus::Failed : ExportStatus::Completed, std::move(error)};
}

}  // namespace lumacast::media
