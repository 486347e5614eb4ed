#include "tests/unit/linux_mp4/Recovery.h"

#include <gtest/gtest.h>

#include "tests/checkers/BoxChecker.h"

namespace lumacast::mp4::test {
namespace {

Bytes bytesOf(const Bytes& file, const ParsedSample& sample) {
    const auto start = file.begin() + static_cast<std::ptrdiff_t>(sample.offset);
    return {start, start + sample.size};
}

}  // namespace

Whole wholeIn(const Bytes& file, std::size_t tracks) {
    Whole whole;
    whole.samples.resize(tracks);
    auto boxes = parseWholeBoxes(file);
    for (ParsedBox& box : boxes) {
        const bool isHidden = box.type == "free" && box.size > 16 && box.payload[7] == 'd' && box.payload[4] == 'm';
        if (box.type != "moof" && !isHidden) {
            continue;
        }
        Bytes copy(file.begin() + static_cast<std::ptrdiff_t>(box.offset),
                   file.begin() + static_cast<std::ptrdiff_t>(box.offset + box.size));
        const Bytes type{'m', 'o', 'o', 'f'};
        std::copy(type.begin(), type.end(), copy.begin() + 4);
        ParsedBox fragment = parseBoxes(copy)[0];
        fragment.offset = box.offset;
        for (const ParsedRun& run : parseFragment(fragment)) {
            for (const ParsedSample& sample : run.samples) {
                if (sample.offset + sample.size > file.size()) {
                    break;
                }
                whole.samples[run.trackId - 1] += 1;
                if (run.trackId == 1) {
                    whole.lastPictureDuration = sample.duration;
                    whole.shownPictures += isHidden ? 0 : 1;
                }
            }
        }
    }
    return whole;
}

Bytes finishedOf(const Material& material, const Whole& whole) {
    Material part = material;
    part.video.samples.resize(whole.samples[0]);
    std::int64_t end = part.video.samples.back().info.pts + whole.lastPictureDuration;
    std::vector<const EncodedAudio*> sounds;
    for (std::size_t i = 0; i < part.sounds.size(); ++i) {
        part.sounds[i].samples.resize(whole.samples[i + 1]);
        sounds.push_back(&part.sounds[i]);
        if (!part.sounds[i].samples.empty()) {
            const auto& last = part.sounds[i].samples.back().info;
            end = std::max(end, (last.pts + last.duration) * 1000 / 48 + ((last.pts + last.duration) * 1000 % 48 >= 24));
        }
    }
    MemorySink sink;
    MovieBoxWriter writer(sink);
    EXPECT_EQ(writeMovie(writer, part.video, sounds), MovieError::none);
    EXPECT_EQ(writer.finish(end), MovieError::none);
    return sink.file();
}

void expectSameMovie(const Bytes& movie, const Bytes& expected, const std::string& state) {
    SCOPED_TRACE(state);
    const auto boxes = parseBoxes(movie);
    const auto expectedBoxes = parseBoxes(expected);
    ASSERT_EQ(typesOf(boxes), "ftyp mdat moov");
    ASSERT_EQ(typesOf(expectedBoxes), "ftyp mdat moov");
    const auto header = boxes[2].at("mvhd").payload;
    const auto expectedHeader = expectedBoxes[2].at("mvhd").payload;
    EXPECT_TRUE(std::ranges::equal(header, expectedHeader)) << "movie header";
    const auto tracks = tracksOf(boxes[2]);
    const auto expectedTracks = tracksOf(expectedBoxes[2]);
    ASSERT_EQ(tracks.size(), expectedTracks.size());
    for (std::size_t i = 0; i < tracks.size(); ++i) {
        const ParsedTrack& track = tracks[i];
        const ParsedTrack& other = expectedTracks[i];
        SCOPED_TRACE("track " + std::to_string(other.id) + " " + other.name);
        EXPECT_EQ(track.id, other.id);
        EXPECT_EQ(track.handler, other.handler);
        EXPECT_EQ(track.name, other.name);
        EXPECT_EQ(track.timescale, other.timescale);
        EXPECT_EQ(track.mediaDuration, other.mediaDuration);
        EXPECT_EQ(track.movieDuration, other.movieDuration);
        EXPECT_EQ(track.matrix, other.matrix);
        EXPECT_EQ(track.width, other.width);
        EXPECT_EQ(track.height, other.height);
        EXPECT_TRUE(std::ranges::equal(boxes[2].all("trak")[i]->at("mdia/minf/stbl/stsd").payload,
                                       expectedBoxes[2].all("trak")[i]->at("mdia/minf/stbl/stsd").payload));
        ASSERT_EQ(track.edits.size(), other.edits.size());
        for (std::size_t e = 0; e < track.edits.size(); ++e) {
            EXPECT_EQ(track.edits[e].duration, other.edits[e].duration) << "edit " << e;
            EXPECT_EQ(track.edits[e].mediaTime, other.edits[e].mediaTime) << "edit " << e;
        }
        ASSERT_EQ(track.samples.size(), other.samples.size());
        for (std::size_t s = 0; s < track.samples.size(); ++s) {
            const ParsedSample& sample = track.samples[s];
            const ParsedSample& otherSample = other.samples[s];
            ASSERT_EQ(sample.decodeTime, otherSample.decodeTime) << "sample " << s;
            ASSERT_EQ(sample.duration, otherSample.duration) << "sample " << s;
            ASSERT_EQ(sample.isSync, otherSample.isSync) << "sample " << s;
            ASSERT_EQ(bytesOf(movie, sample), bytesOf(expected, otherSample)) << "sample " << s;
        }
    }
}

void expectSoundBoxes(const std::string& path, const std::string& state) {
    const auto report = checkers::checkBoxes(path);
    for (const auto& finding : report.findings) {
        ADD_FAILURE() << state << ": " << finding;
    }
}

}  // namespace lumacast::mp4::test
