#include "linux/media/mp4/TrackBoxes.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <initializer_list>
#include <limits>

#include "linux/media/mp4/BoxBuffer.h"
#include "linux/media/mp4/SampleDescription.h"
#include "linux/media/mp4/SampleIndex.h"
#include "linux/media/mp4/SampleTables.h"

namespace lumacast::mp4 {
namespace {

// All ones means "unknown" in the 32-bit fields (ISO/IEC 14496-12 clauses 8.2.2, 8.3.2 and 8.4.2), so it needs 64 bits
// too.
bool needsWide(std::initializer_list<std::uint64_t> values) {
    return std::any_of(values.begin(), values.end(),
                       [](std::uint64_t value) { return value >= std::numeric_limits<std::uint32_t>::max(); });
}

void time(BoxBuffer& out, bool wide, std::uint64_t value) {
    if (wide) {
        out.u64(value);
    } else {
        out.u32(static_cast<std::uint32_t>(value));
    }
}

std::int32_t fixedPoint(double value, int fractionBits) {
    const double scaled = std::round(std::ldexp(value, fractionBits));
    constexpr double kLowest = std::numeric_limits<std::int32_t>::min();
    constexpr double kHighest = std::numeric_limits<std::int32_t>::max();
    return std::isnan(scaled) ? 0 : static_cast<std::int32_t>(std::clamp(scaled, kLowest, kHighest));
}

// ISO/IEC 14496-12 clause 6.2.2: { a b u / c d v / x y w }, all 16.16 but u, v and w, which are 2.30.
void writeMatrix(BoxBuffer& out, const AffineTransform& transform) {
    const std::array<std::array<double, 2>, 3> rows{
        {{transform.a, transform.b}, {transform.c, transform.d}, {transform.tx, transform.ty}}};
    for (std::size_t row = 0; row < rows.size(); ++row) {
        out.i32(fixedPoint(rows[row][0], 16));
        out.i32(fixedPoint(rows[row][1], 16));
        out.i32(fixedPoint(row == 2 ? 1 : 0, 30));
    }
}

// ISO/IEC 14496-12 clause 8.3.2.
void writeTrackHeader(BoxBuffer& out, const TrackDescription& track, const TrackTiming& timing) {
    constexpr std::uint32_t kEnabledInMovieInPreview = 7;
    constexpr std::uint16_t kFullVolume = 0x0100;
    const auto* video = std::get_if<VideoTrackDescription>(&track);
    const bool wide = needsWide({timing.creationTime, timing.movieDuration});
    const Box box(out, "tkhd", wide ? 1 : 0, kEnabledInMovieInPreview);
    time(out, wide, timing.creationTime);
    time(out, wide, timing.creationTime);  // modification_time
    out.u32(timing.id);
    out.u32(0);
    time(out, wide, timing.movieDuration);
    out.zeros(8);
    out.i16(0);  // layer
    out.i16(0);  // alternate_group: none, both sounds belong to the movie and play together
    out.u16(video != nullptr ? 0 : kFullVolume);
    out.u16(0);
    writeMatrix(out, video != nullptr ? video->transform : AffineTransform{});
    double width = 0;
    double height = 0;
    if (video != nullptr) {
        const PixelAspectRatio ratio = video->pixelAspectRatio.value_or(PixelAspectRatio{});
        width = static_cast<double>(video->width) * ratio.horizontal / ratio.vertical;
        height = video->height;
    }
    // Unsigned 16.16: a width of 32768 pixels and more still fits.
    constexpr double kHighest = std::numeric_limits<std::uint32_t>::max();
    out.u32(static_cast<std::uint32_t>(std::min(std::round(std::ldexp(width, 16)), kHighest)));
    out.u32(static_cast<std::uint32_t>(std::ldexp(height, 16)));
}

// ISO/IEC 14496-12 clauses 8.6.5 and 8.6.6.
void writeEdits(BoxBuffer& out, std::span<const Edit> edits) {
    if (edits.empty()) {
        return;
    }
    const bool wide = std::any_of(edits.begin(), edits.end(), [](const Edit& edit) {
        return edit.duration > std::numeric_limits<std::uint32_t>::max() ||
               edit.mediaTime > std::numeric_limits<std::int32_t>::max();
    });
    const Box container(out, "edts");
    const Box box(out, "elst", wide ? 1 : 0, 0);
    out.u32(static_cast<std::uint32_t>(edits.size()));
    for (const Edit& edit : edits) {
        time(out, wide, edit.duration);
        time(out, wide, static_cast<std::uint64_t>(edit.mediaTime));  // two's complement keeps kEmpty at either width
        out.u32(0x00010000);                                          // media_rate 1.0
    }
}

// ISO/IEC 14496-12 clause 8.4.2.
void writeMediaHeader(BoxBuffer& out, std::uint32_t timescale, std::uint64_t creationTime, std::uint64_t duration) {
    constexpr std::uint16_t kUndetermined = 0x55C4;  // "und", three letters of five bits
    const bool wide = needsWide({creationTime, duration});
    const Box box(out, "mdhd", wide ? 1 : 0, 0);
    time(out, wide, creationTime);
    time(out, wide, creationTime);  // modification_time
    out.u32(timescale);
    time(out, wide, duration);
    out.u16(kUndetermined);
    out.u16(0);
}

// ISO/IEC 14496-12 clause 8.4.3.
void writeHandler(BoxBuffer& out, FourCC type, const std::string& name) {
    const Box box(out, "hdlr", 0, 0);
    out.u32(0);
    out.code(type);
    out.zeros(12);
    out.text(name);
}

// ISO/IEC 14496-12 clauses 8.7.1 and 8.7.2: the media are in this file.
void writeDataInformation(BoxBuffer& out) {
    constexpr std::uint32_t kSelfContained = 1;
    const Box box(out, "dinf");
    const Box references(out, "dref", 0, 0);
    out.u32(1);
    const Box url(out, "url ", 0, kSelfContained);
}

void writeMediaInformation(BoxBuffer& out, const TrackDescription& track, const SampleIndex& index) {
    const Box box(out, "minf");  // ISO/IEC 14496-12 clause 8.4.4
    const auto* video = std::get_if<VideoTrackDescription>(&track);
    if (video != nullptr) {
        const Box header(out, "vmhd", 0, 1);  // ISO/IEC 14496-12 clause 12.1.2; the flag is required to be 1
        out.zeros(8);                         // graphicsmode copy, opcolor
    } else {
        const Box header(out, "smhd", 0, 0);  // ISO/IEC 14496-12 clause 12.2.2
        out.zeros(4);                         // balance in the middle
    }
    writeDataInformation(out);
    const Box table(out, "stbl");  // ISO/IEC 14496-12 clause 8.5.1
    std::visit([&out](const auto& description) { writeSampleDescription(out, description); }, track);
    writeSampleTables(out, index);
}

}  // namespace

std::uint32_t timescaleOf(const TrackDescription& track) {
    const auto* video = std::get_if<VideoTrackDescription>(&track);
    return video != nullptr ? video->timescale : std::get<AudioTrackDescription>(track).sampleRate;
}

void writeTrack(BoxBuffer& out, const TrackDescription& track, const TrackTiming& timing, const SampleIndex& index) {
    const bool isVideo = std::holds_alternative<VideoTrackDescription>(track);
    const Box box(out, "trak");  // ISO/IEC 14496-12 clause 8.3.1
    writeTrackHeader(out, track, timing);
    writeEdits(out, timing.edits);
    const Box media(out, "mdia");  // ISO/IEC 14496-12 clause 8.4.1
    writeMediaHeader(out, timescaleOf(track), timing.creationTime, index.totalDuration());
    writeHandler(out, isVideo ? FourCC("vide") : FourCC("soun"),
                 std::visit([](const auto& description) { return description.name; }, track));
    writeMediaInformation(out, track, index);
}

void writeMovieHeader(BoxBuffer& out, const MovieTiming& timing) {
    const bool wide = needsWide({timing.creationTime, timing.duration});
    const Box box(out, "mvhd", wide ? 1 : 0, 0);  // ISO/IEC 14496-12 clause 8.2.2
    time(out, wide, timing.creationTime);
    time(out, wide, timing.creationTime);  // modification_time
    out.u32(timing.timescale);
    time(out, wide, timing.duration);
    out.u32(0x00010000);  // rate 1.0
    out.u16(0x0100);      // volume 1.0
    out.zeros(10);
    writeMatrix(out, AffineTransform{});
    out.zeros(24);
    out.u32(timing.nextTrackId);
}

}  // namespace lumacast::mp4
