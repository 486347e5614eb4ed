#include "linux/media/PassThroughExport.h"

#include <algorithm>
#include <limits>
#include <utility>
#include <vector>

#include "linux/media/MovieSource.h"
#include "linux/media/PictureTrack.h"
#include "linux/media/SoundTrack.h"
#include "linux/media/mp4/MovieBoxWriter.h"
#include "linux/media/mp4/Ticks.h"

namespace lumacast::media {

namespace {

/// Sound that a decoder wants before the first sound that is heard: two packets of AAC, and a third for rounding.
constexpr std::int64_t kSoundLeadNanoseconds = 70'000'000;
/// How far tracks may lie apart in a file; past the range by so much nothing of it follows.
constexpr std::int64_t kInterleavingNanoseconds = 10'000'000'000;

std::int64_t nanosecondsOfTicks(std::int64_t ticks, int timescale) {
    return av_rescale(ticks, 1'000'000'000, timescale);
}

/// One export while it runs.
class Copy final {
public:
    Copy(MovieSource& source, ExportSink& sink, ExportSpan span, ExportState& state)
        : source_(source), sink_(sink), span_(span), state_(state), movie_(sink, options(span)) {}

    ExportResult run() {
        if (!source_.declareTracks(movie_, ids_)) return failed(systemError(ENOTSUP));
        if (const auto error = movieError(movie_.start())) return failed(*error);
        keyFrame_ = source_.keyFrameBefore(span_.start);
        if (const auto error = source_.seek(span_.start - kSoundLeadNanoseconds)) return failed(*error);
        std::vector<bool> passed(source_.tracks().size());
        for (;;) {
            if (state_.isCancelled()) return {ExportStatus::Cancelled, systemError(ECANCELED)};
            auto next = source_.read();
            if (auto* const error = std::get_if<Error>(&next)) return failed(*error);
            const auto& sample = std::get<0>(next);
            if (!sample) break;
            const int timescale = source_.tracks()[sample->track].timescale;
            const std::int64_t begin = nanosecondsOfTicks(sample->stamp, timescale);
            state_.advance(static_cast<double>(begin - span_.start) / static_cast<double>(span_.end - span_.start));
            if (begin >= span_.end + kInterleavingNanoseconds) break;
            if (begin >= span_.end) {
                passed[sample->track] = true;
                if (std::all_of(passed.begin(), passed.end(), [](bool is) { return is; })) break;
                continue;
            }
            if (const auto error = copy(*sample, timescale)) return failed(*error);
        }
        const auto error = movieError(movie_.finish(lastPictureEnd_, span_.end));
        return error ? failed(*error) : ExportResult{ExportStatus::Completed, std::nullopt};
    }

private:
    static mp4::MovieOptions options(const ExportSpan& span) {
        mp4::MovieOptions options;
        options.presentationStart = span.start;
        options.purpose = mp4::MoviePurpose::copy;
        return options;
    }

    std::optional<Error> copy(const MovieSource::Sample& sample, int timescale) {
        const bool isVideo = source_.tracks()[sample.track].isVideo;
        const std::int64_t end = sample.stamp + sample.duration;
        const bool isNeeded = isVideo ? !keyFrame_ || sample.stamp >= *keyFrame_
                                      : nanosecondsOfTicks(end, timescale) > span_.start - kSoundLeadNanoseconds;
        if (!isNeeded) return std::nullopt;
        if (sample.duration < 0 || sample.duration > std::numeric_limits<std::uint32_t>::max())
            return systemError(EPROTO);
        std::int64_t stamp = sample.stamp;
        if (isVideo) {
            // The picture that is on show when the range begins begins with it: players drop what begins before an
            // edit.
            const std::int64_t start =
                mp4::rescale(span_.start, mp4::kNanosecondTimescale, static_cast<std::uint32_t>(timescale));
            if (stamp < start && end > start) stamp = start;
            lastPictureEnd_ = end;
        }
        const auto result = movie_.addSample(
            ids_[sample.track], {stamp, static_cast<std::uint32_t>(end - stamp), sample.isKeyFrame}, sample.bytes);
        // What a recording may leave out, a copy must not.
        const bool isRefused = result != mp4::MovieError::none && result != mp4::MovieError::sinkFailed;
        return isRefused ? systemError(EPROTO) : movieError(result);
    }

    ExportResult failed(Error error) const {
        return {ExportStatus::Failed, sink_.error() != 0 ? systemError(sink_.error()) : std::move(error)};
    }

    MovieSource& source_;
    ExportSink& sink_;
    const ExportSpan span_;
    ExportState& state_;
    mp4::MovieBoxWriter movie_;
    std::vector<mp4::TrackId> ids_;
    std::optional<std::int64_t> keyFrame_;
    std::int64_t lastPictureEnd_ = 0;
};

}  // namespace

ExportResult exportPassThrough(MovieSource& source, ExportSink& sink, ExportSpan span, ExportState& state) {
    return Copy(source, sink, span, state).run();
}

}  // namespace lumacast::media
