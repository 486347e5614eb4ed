#include "linux/media/mp4/UnfinishedMovie.h"

#include <algorithm>
#include <array>
#include <limits>
#include <numeric>
#include <utility>

#include "linux/media/mp4/BoxReader.h"
#include "linux/media/mp4/BoxSource.h"
#include "linux/media/mp4/FileHead.h"
#include "linux/media/mp4/FragmentBoxes.h"
#include "linux/media/mp4/FragmentReader.h"
#include "linux/media/mp4/SampleCheck.h"

namespace lumacast::mp4 {
namespace {

constexpr std::uint32_t kHeaderBytes = 8;
// Seven hours of 60 pictures a second and two sound tracks. The index takes 34 MB then, and its tables 85 at most.
constexpr std::uint64_t kMaxSamples = 1U << 22U;
// Of the samples of a fragment that nobody has synced: each byte of them is looked at. Ours have 8 MiB.
constexpr std::uint64_t kMaxCheckedBytes = 64U << 20U;
// Boxes behind the last fragment: one or two fragments, and indexes whose writers were stopped.
constexpr int kMaxBoxesBehind = 64;

struct BoxHeader {
    std::uint64_t offset = 0;
    std::uint32_t size = 0;  // as it is stated
    std::uint32_t type = 0;
    [[nodiscard]] std::uint64_t end() const { return offset + size; }
};

// A fragment's type, shown, hidden or torn on the way from one to the other.
bool mayBeFragment(std::uint32_t type) {
    for (unsigned shift = 0; shift < 32; shift += 8) {
        const std::uint32_t letter = (type >> shift) & 0xFFU;
        if (letter != ((FourCC("free").value >> shift) & 0xFFU) && letter != ((FourCC("moof").value >> shift) & 0xFFU)) {
            return false;
        }
    }
    return true;
}

class Walk {
public:
    explicit Walk(BoxSource& source) : source_(source) {}

    std::variant<UnfinishedMovie, UnreadableMovie> run() {
        auto initial = readInitialMovie(source_);
        if (const auto* why = std::get_if<UnreadableMovie>(&initial)) {
            return *why;
        }
        movie_.initial = std::move(std::get<InitialMovie>(initial));
        if (movie_.initial.note.kind != NoteKind::recording) {
            return UnreadableMovie::copy;
        }
        movie_.fileBytes = source_.size();
        const auto movieBox = headerAt(kFileStartBytes);
        if (!movieBox) {
            return problem_.value_or(UnreadableMovie::nothingWhole);
        }
        position_ = movieBox->end();
        while (takeFragment()) {
        }
        if (!problem_) {
            lookBehind();
        }
        if (!problem_ && shown_ == 0) {
            problem_ = UnreadableMovie::nothingWhole;
        }
        if (problem_) {
            return *problem_;
        }
        return std::move(movie_);
    }

private:
    std::optional<BoxHeader> headerAt(std::uint64_t offset) {
        std::array<std::uint8_t, kHeaderBytes> bytes;
        if (offset > movie_.fileBytes || movie_.fileBytes - offset < bytes.size()) {
            return std::nullopt;
        }
        if (!source_.read(offset, bytes)) {
            problem_ = UnreadableMovie::sourceFailed;
            return std::nullopt;
        }
        BoxReader in(bytes);
        const std::uint32_t size = in.u32();
        return BoxHeader{offset, size, in.u32()};
    }

    // False when no more can be taken: the fragments are over, or a problem was found.
    bool takeFragment() {
        const auto header = headerAt(position_);
        if (!header || !mayBeFragment(header->type) || header->size > kMaxFragmentHeaderBytes ||
            header->size <= kHeaderBytes || header->end() > movie_.fileBytes) {
            return false;
        }
        const auto media = headerAt(header->end());
        if (!media || media->type != FourCC("mdat").value) {
            return false;
        }
        box_.resize(header->size);
        if (!source_.read(header->offset, box_)) {
            problem_ = UnreadableMovie::sourceFailed;
            return false;
        }
        const auto fragment = readFragment(box_, movie_.initial.tracks);
        if (!fragment || fragment->sequenceNumber != movie_.fragments + 1 ||
            media->size != fragment->mediaBytes + kMediaHeaderBytes || !fits(*fragment)) {
            return false;
        }
        const bool isWhole = media->end() <= movie_.fileBytes;
        const bool isShown = header->type == FourCC("moof").value && isWhole;
        if (!isShown && fragment->mediaBytes > kMaxCheckedBytes) {
            return false;
        }
        const bool hasAll = take(*fragment, header->offset, !isShown);
        if (problem_) {
            return false;
        }
        movie_.fragments += 1;
        shown_ += isShown ? 1 : 0;
        position_ = isWhole ? media->end() : media->offset;
        return hasAll && isWhole;
    }

    // Whether the fragment continues what there is of each of its tracks.
    bool fits(const Fragment& fragment) {
        std::uint64_t samples = samples_;
        for (const FragmentRun& run : fragment.runs) {
            const MovieTrack& track = movie_.initial.tracks[run.trackId - 1];
            const std::uint64_t latest = std::uint64_t{track.timescale} * static_cast<std::uint64_t>(kMaxMovieSeconds);
            const std::uint64_t length = std::accumulate(
                run.samples.begin(), run.samples.end(), std::uint64_t{0},
                [](std::uint64_t sum, const IndexedSample& sample) { return sum + sample.duration; });
            const bool beginsWrong = !track.hasSamples() && track.isVideo() && run.samples[0].isSync == 0;
            if (beginsWrong || length > latest || run.decodeTime > latest - length) {
                return false;
            }
            const std::int64_t stamp = static_cast<std::int64_t>(run.decodeTime) - track.fragmentSkip;
            if (track.hasSamples() && (stamp <= track.lastStart() || stamp - track.lastStart() > kMaxDuration)) {
                return false;
            }
            samples += run.samples.size();
        }
        if (samples > kMaxSamples) {
            problem_ = UnreadableMovie::tooLong;
        }
        return !problem_;
    }

    // Whether all samples were taken: where they are to be checked, each track ends before the first one in doubt.
    bool take(const Fragment& fragment, std::uint64_t offset, bool isToBeChecked) {
        bool hasAll = true;
        for (const FragmentRun& run : fragment.runs) {
            MovieTrack& track = movie_.initial.tracks[run.trackId - 1];
            const auto kind = track.isVideo() ? SampleKind::video : SampleKind::sound;
            const std::uint64_t start = offset + run.mediaOffset;
            std::uint64_t at = start;
            std::uint32_t count = 0;
            for (const IndexedSample& sample : run.samples) {
                if (isToBeChecked && !carriesData(source_, at, sample.size, kind)) {
                    hasAll = false;
                    break;
                }
                at += sample.size;
                add(track, run, sample, count == 0);
                count += 1;
            }
            if (count > 0) {
                track.index.addChunk(start, count);
            }
            samples_ += count;
        }
        return hasAll;
    }

    static void add(MovieTrack& track, const FragmentRun& run, const IndexedSample& sample, bool isFirstOfRun) {
        if (isFirstOfRun) {
            const std::int64_t stamp = static_cast<std::int64_t>(run.decodeTime) - track.fragmentSkip;
            if (track.hasSamples()) {
                // What the fragment before stated of its last sample is surely presented, not all of it.
                track.index.setLastDuration(static_cast<std::uint32_t>(stamp - track.lastStart()));
            } else {
                track.firstPts = stamp;
            }
        }
        track.index.add(sample);
    }

    // What a crash leaves behind the fragments: some that are not whole, indexes that were never switched to, and a box
    // that was torn. Anything that players show must not be there: without it the movie would be worse than before.
    void lookBehind() {
        std::uint64_t at = position_;
        for (int boxes = 0; at < movie_.fileBytes; ++boxes) {
            const auto header = headerAt(at);
            if (problem_) {
                return;
            }
            if (!header) {
                movie_.end.header.resize(static_cast<std::size_t>(movie_.fileBytes - at));
                if (!source_.read(at, movie_.end.header)) {
                    problem_ = UnreadableMovie::sourceFailed;
                }
                return;
            }
            if (header->type == FourCC("moof").value || boxes == kMaxBoxesBehind) {
                problem_ = UnreadableMovie::damaged;
                return;
            }
            if (header->size < kHeaderBytes) {
                return;  // to the end of the file, or nothing that a reader goes on behind
            }
            if (header->end() == movie_.fileBytes && header->type == FourCC("free").value && isHiddenIndex(*header)) {
                movie_.hiddenIndex = at;
            }
            at = header->end();
        }
        movie_.end.nextBox = at;
    }

    bool isHiddenIndex(const BoxHeader& box) {
        const auto inside = headerAt(box.offset + kHeaderBytes);
        return inside && inside->type == FourCC("moov").value && inside->end() == box.end();
    }

    static constexpr std::int64_t kMaxDuration = std::numeric_limits<std::uint32_t>::max();

    BoxSource& source_;
    UnfinishedMovie movie_;
    std::vector<std::uint8_t> box_;
    std::uint64_t position_ = 0;
    std::uint64_t samples_ = 0;
    std::uint32_t shown_ = 0;
    std::optional<UnreadableMovie> problem_;
};

}  // namespace

std::variant<InitialMovie, UnreadableMovie> readInitialMovie(BoxSource& source) {
    std::array<std::uint8_t, kHeaderBytes> header;
    if (source.size() < kFileStartBytes + header.size()) {
        return UnreadableMovie::nothingWhole;
    }
    if (!source.read(kFileStartBytes, header)) {
        return UnreadableMovie::sourceFailed;
    }
    BoxReader in(header);
    const std::uint32_t size = in.u32();
    if (in.u32() != FourCC("moov").value || size < header.size() || size > kMaxInitialMovieBytes) {
        return UnreadableMovie::notOurs;
    }
    if (size > source.size() - kFileStartBytes) {
        return UnreadableMovie::nothingWhole;
    }
    std::vector<std::uint8_t> box(size);
    if (!source.read(kFileStartBytes, box)) {
        return UnreadableMovie::sourceFailed;
    }
    auto movie = readInitialMovie(box);
    return movie ? std::variant<InitialMovie, UnreadableMovie>(std::move(*movie)) : UnreadableMovie::notOurs;
}

std::variant<UnfinishedMovie, UnreadableMovie> readUnfinishedMovie(BoxSource& source) {
    return Walk(source).run();
}

}  // namespace lumacast::mp4
