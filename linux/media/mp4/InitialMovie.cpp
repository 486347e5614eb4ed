#include "linux/media/mp4/InitialMovie.h"

#include <algorithm>
#include <string>

#include "linux/media/mp4/BoxReader.h"
#include "linux/media/mp4/SampleDescription.h"
#include "linux/media/mp4/Ticks.h"

namespace lumacast::mp4 {
namespace {

using Payload = std::span<const std::uint8_t>;
using ParameterSetList = std::vector<std::vector<std::uint8_t>>;

// The fields are read where this writer puts them and nothing else is looked at: what was read is written again and
// compared, so that a box which says anything more, or anything else, is found out there.

// Version and flags of a FullBox, then times of the width that the version says.
class TimedFields {
public:
    explicit TimedFields(Payload box) : in(box), wide_(in.u8() == 1) { in.skip(3); }
    std::uint64_t time() { return in.number(wide_ ? 8 : 4); }
    BoxReader in;

private:
    bool wide_;
};

double fraction(std::uint32_t fixedPoint, double one) {
    return static_cast<double>(static_cast<std::int32_t>(fixedPoint)) / one;
}

// ISO/IEC 14496-12 clause 6.2.2.
AffineTransform readMatrix(BoxReader& in) {
    constexpr double kOne = 65536;
    AffineTransform transform;
    transform.a = fraction(in.u32(), kOne);
    transform.b = fraction(in.u32(), kOne);
    in.skip(4);
    transform.c = fraction(in.u32(), kOne);
    transform.d = fraction(in.u32(), kOne);
    in.skip(4);
    transform.tx = fraction(in.u32(), kOne);
    transform.ty = fraction(in.u32(), kOne);
    in.skip(4);
    return transform;
}

ParameterSetList readParameterSets(BoxReader& in, std::size_t count) {
    ParameterSetList sets;
    for (std::size_t i = 0; i < count && !in.failed(); ++i) {
        const auto bytes = in.take(in.u16());
        sets.emplace_back(bytes.begin(), bytes.end());
    }
    return sets;
}

std::string readName(Payload handler) {
    BoxReader in(handler);
    in.skip(24);
    const auto text = in.take(in.left());
    return {text.begin(), std::find(text.begin(), text.end(), 0)};
}

VideoTrackDescription readVideo(Payload entry, std::uint32_t timescale, const AffineTransform& transform) {
    VideoTrackDescription track;
    BoxReader in(entry);
    in.skip(24);
    track.width = in.u16();
    track.height = in.u16();
    in.skip(50);
    const Payload boxes = in.take(in.left());
    track.timescale = timescale;
    track.transform = transform;
    BoxReader configuration(findBox(boxes, "avcC"));
    configuration.skip(5);
    track.sequenceParameterSets = readParameterSets(configuration, configuration.u8() & 0x1FU);
    track.pictureParameterSets = readParameterSets(configuration, configuration.u8());
    track.colour.reset();
    if (const Payload colour = findBox(boxes, "colr"); !colour.empty()) {
        BoxReader fields(colour);
        fields.skip(4);
        track.colour = {fields.u16(), fields.u16(), fields.u16(), fields.u8() != 0};
    }
    if (const Payload ratio = findBox(boxes, "pasp"); !ratio.empty()) {
        BoxReader fields(ratio);
        track.pixelAspectRatio = {fields.u32(), fields.u32()};
    }
    return track;
}

AudioTrackDescription readSound(Payload entry, std::uint32_t timescale) {
    AudioTrackDescription track;
    BoxReader in(entry);
    in.skip(16);
    track.channels = in.u16();
    in.skip(10);
    track.sampleRate = timescale;
    BoxReader descriptors(findBox(in.take(in.left()), "esds"));
    descriptors.skip(4 + 2 + 3 + 2 + 2 + 3 + 4);
    track.bitRate = descriptors.u32();
    descriptors.skip(1);
    const auto config = descriptors.take(descriptors.u8());
    track.audioSpecificConfig.assign(config.begin(), config.end());
    return track;
}

// The one edit of a track that has ticks to skip; 0 without one.
std::int64_t readSkip(Payload track) {
    const Payload list = findBox(findBox(track, "edts"), "elst");
    if (list.empty()) {
        return 0;
    }
    TimedFields fields(list);
    fields.in.skip(4);
    (void)fields.time();
    return static_cast<std::int64_t>(fields.time());
}

std::optional<MovieTrack> readTrack(Payload box, std::uint32_t priming) {
    MovieTrack track;
    TimedFields header(findBox(box, "tkhd"));
    (void)header.time();
    (void)header.time();
    track.id = header.in.u32();
    header.in.skip(4);
    (void)header.time();
    header.in.skip(16);
    const AffineTransform transform = readMatrix(header.in);

    const Payload media = findBox(box, "mdia");
    TimedFields mediaHeader(findBox(media, "mdhd"));
    (void)mediaHeader.time();
    (void)mediaHeader.time();
    track.timescale = mediaHeader.in.u32();

    BoxReader entries(findBox(findBox(findBox(media, "minf"), "stbl"), "stsd"));
    entries.skip(8);
    const auto entry = nextBox(entries);
    if (!entry) {
        return std::nullopt;
    }
    const std::string name = readName(findBox(media, "hdlr"));
    bool isDescribed = false;
    if (entry->type == FourCC("avc1").value) {
        VideoTrackDescription video = readVideo(entry->payload, track.timescale, transform);
        video.name = name;
        isDescribed = isValid(video) && priming == 0;
        track.description = std::move(video);
    } else {
        AudioTrackDescription sound = readSound(entry->payload, track.timescale);
        sound.name = name;
        sound.primingFrames = priming;
        isDescribed = isValid(sound);
        track.description = std::move(sound);
    }
    track.priming = priming;
    track.fragmentSkip = readSkip(box);
    const bool isInRange = track.fragmentSkip >= track.priming && track.timescale != 0 &&
                           track.fragmentSkip / track.timescale < kMaxMovieSeconds;
    return isDescribed && isInRange ? std::optional(std::move(track)) : std::nullopt;
}

}  // namespace

std::optional<InitialMovie> readInitialMovie(std::span<const std::uint8_t> box) {
    if (box.size() > kMaxInitialMovieBytes) {
        return std::nullopt;
    }
    const Payload payload = findBox(box, "moov");
    const auto note = readNote(findBox(payload, "uuid"));
    if (!note || note->primings.empty() || note->primings.size() > kMaxTracks) {
        return std::nullopt;
    }
    InitialMovie movie;
    movie.note = *note;
    TimedFields header(findBox(payload, "mvhd"));
    movie.head.creationTime = header.time();
    (void)header.time();
    movie.head.timescale = header.in.u32();
    if (movie.head.timescale == 0 || movie.head.timescale > kNanosecondTimescale) {
        return std::nullopt;
    }
    BoxReader boxes(payload);
    std::size_t videos = 0;
    while (const auto child = nextBox(boxes)) {
        if (child->type != FourCC("trak").value) {
            continue;
        }
        const std::size_t number = movie.tracks.size();
        auto track = number < note->primings.size() ? readTrack(child->payload, note->primings[number]) : std::nullopt;
        if (!track || track->id != number + 1) {
            return std::nullopt;
        }
        videos += track->isVideo() ? 1 : 0;
        movie.tracks.push_back(std::move(*track));
    }
    if (movie.tracks.size() != note->primings.size() || videos > 1) {
        return std::nullopt;
    }
    BoxBuffer again;
    writeInitialMovie(again, movie.head, movie.tracks, movie.note);
    return std::ranges::equal(again.view(), box) ? std::optional(std::move(movie)) : std::nullopt;
}

std::optional<std::int64_t> movieDuration(std::span<const std::uint8_t> movieHeader) {
    TimedFields header(movieHeader);
    (void)header.time();
    (void)header.time();
    const std::uint32_t timescale = header.in.u32();
    const std::uint64_t ticks = header.time();
    if (header.in.failed() || timescale == 0 || timescale > kNanosecondTimescale || ticks == 0 ||
        ticks / timescale >= static_cast<std::uint64_t>(kMaxMovieSeconds)) {
        return std::nullopt;
    }
    return rescale(static_cast<std::int64_t>(ticks), timescale, kNanosecondTimescale);
}

std::optional<std::uint64_t> mediaDuration(std::span<const std::uint8_t> movie, std::uint32_t trackId) {
    BoxReader boxes(movie);
    while (const auto child = nextBox(boxes)) {
        if (child->type != FourCC("trak").value) {
            continue;
        }
        TimedFields header(findBox(child->payload, "tkhd"));
        (void)header.time();
        (void)header.time();
        if (header.in.u32() != trackId) {
            continue;
        }
        TimedFields media(findBox(findBox(child->payload, "mdia"), "mdhd"));
        (void)media.time();
        (void)media.time();
        media.in.skip(4);
        const std::uint64_t duration = media.time();
        return media.in.failed() ? std::nullopt : std::optional(duration);
    }
    return std::nullopt;
}

}  // namespace lumacast::mp4
