// One recording, byte for byte: what the writer makes of fixed samples is kept as text beside this file, so that a change
// of the file's layout is seen in a diff, and is made on purpose. LC_WRITE_GOLDEN=1 writes the texts anew (and the tests
// fail): look at the difference before keeping it.

#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <iterator>
#include <sstream>

#include "tests/checkers/BoxChecker.h"
#include "tests/unit/linux_mp4/BoxDump.h"
#include "tests/unit/linux_mp4/Descriptions.h"
#include "tests/unit/linux_mp4/Tools.h"

namespace lumacast::mp4 {
namespace {

using test::Bytes;

constexpr std::size_t kBeforeMovie = 48;  // the file type and the reserve

// 1280x720 in High profile, with the colours of SMPTE 170M.
VideoTrackDescription picture() {
    VideoTrackDescription track;
    track.width = 1280;
    track.height = 720;
    track.sequenceParameterSets = {{0x67, 0x64, 0x00, 0x20, 0xAC, 0xB4, 0x02, 0x80, 0x2D, 0xD3, 0x50, 0x60, 0x60, 0x6A,
                                    0x50, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x07, 0x88, 0xF1, 0x83, 0x2A}};
    track.pictureParameterSets = {{0x68, 0xEE, 0x06, 0xF2, 0xC0}};
    track.transform = {0, 1, -1, 0, 720, 0};  // a quarter turn clockwise
    track.pixelAspectRatio = PixelAspectRatio{4, 3};
    return track;
}

AudioTrackDescription microphone() {
    AudioTrackDescription track;
    track.sampleRate = 44100;
    track.channels = 1;
    track.audioSpecificConfig = {0x12, 0x08};
    track.primingFrames = 2048;
    track.bitRate = 64000;
    track.name = "Microphone";
    return track;
}

// One NAL unit of a slice with its length.
Bytes slice(bool isKey, std::uint32_t number, std::size_t size) {
    Bytes bytes = test::payload(number, size);
    for (std::size_t place = 0; place < 4; ++place) bytes[place] = static_cast<std::uint8_t>((size - 4) >> (24 - 8 * place));
    bytes[4] = isKey ? 0x65 : 0x41;
    return bytes;
}

struct Input {
    int track;
    SampleInfo info;
    Bytes bytes;
};

// Pictures at odd distances; sound with its priming from the beginning on, a microphone that begins 0.4 s late, and a
// pause, after which every track goes on with the next stamp and the first picture is a key frame.
std::vector<Input> samples() {
    const SampleInfo key{0, 0, true};
    std::vector<Input> all{{0, key, slice(true, 1, 23)}, {1, {-1024, 1024}, test::payload(2, 9)}};
    const auto picture = [&](std::int64_t pts, bool isKey, std::uint32_t number, std::size_t size) {
        all.push_back({0, {pts, 0, isKey}, slice(isKey, number, size)});
    };
    const auto sound = [&](int track, std::int64_t pts, std::uint32_t duration, std::uint32_t number, std::size_t size) {
        all.push_back({track, {pts, duration}, test::payload(number, size)});
    };
    picture(33'333, false, 3, 11);
    sound(1, 0, 1024, 4, 12);
    picture(66'667, false, 5, 12);
    picture(66'668, false, 6, 13);  // a tick later
    sound(1, 1024, 1024, 7, 7);
    sound(2, 17'640 - 2048, 1024, 8, 6);
    sound(2, 17'640 - 1024, 1024, 9, 5);
    picture(512'345, false, 10, 17);
    sound(2, 17'640, 700, 11, 8);  // cut short by the pause
    all.push_back({-1, {}, {}});
    picture(600'001, true, 12, 31);
    sound(1, 2048, 1024, 13, 10);
    sound(2, 18'340, 1024, 14, 4);
    picture(1'600'000, true, 15, 21);
    sound(1, 3072, 1024, 16, 9);
    return all;
}

struct Recording {
    Bytes underWay;
    Bytes finished;
};

Recording record() {
    MovieOptions options;
    options.creationTime = 3'800'000'000;
    test::MemorySink sink;
    MovieBoxWriter writer(sink, options);
    const std::optional<TrackId> ids[]{writer.addVideoTrack(picture()), writer.addAudioTrack(test::audioDescription()),
                                       writer.addAudioTrack(microphone())};
    EXPECT_EQ(writer.start(), MovieError::none);
    for (const Input& input : samples()) {
        if (input.track < 0) EXPECT_EQ(writer.flushFragment(), MovieError::none);
        else EXPECT_EQ(writer.addSample(*ids[input.track], input.info, input.bytes), MovieError::none);
    }
    EXPECT_EQ(writer.flushFragment(), MovieError::none);
    Recording recording;
    recording.underWay = sink.file();
    EXPECT_EQ(writer.finish(1'723'457), MovieError::none);
    recording.finished = sink.file();
    return recording;
}

std::vector<std::string> linesOf(const std::string& text) {
    std::istringstream stream(text);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    return lines;
}

void expectGolden(const std::string& name, const std::string& text) {
    const std::string path = std::string(LC_SOURCE_DIR "/tests/unit/linux_mp4/golden/") + name;
    if (const char* wanted = std::getenv("LC_WRITE_GOLDEN"); wanted != nullptr && *wanted == '1') {
        std::ofstream(path) << text;
        FAIL() << path << " was written; look at what has changed";
    }
    std::ifstream file(path);
    const std::string golden{std::istreambuf_iterator<char>(file), {}};
    ASSERT_FALSE(golden.empty()) << path;
    if (text == golden) return;
    const auto now = linesOf(text), before = linesOf(golden);
    std::size_t place = 0;
    while (place < now.size() && place < before.size() && now[place] == before[place]) ++place;
    std::string box;  // the last line that names one
    for (std::size_t line = 0; line <= place && line < now.size(); ++line) {
        const std::size_t first = now[line].find_first_not_of(' ');
        if (now[line][first] != ':' && !now[line].ends_with(" recorded")) box = now[line].substr(first, 4);
    }
    ADD_FAILURE() << name << " is another one from line " << place + 1 << " on, in " << box << "\n- "
                  << (place < before.size() ? before[place] : "the end") << "\n+ "
                  << (place < now.size() ? now[place] : "the end");
}

TEST(Golden, ARecordingUnderWayIsWhatItWasByteForByte) { expectGolden("under_way.txt", test::dumpOf(record().underWay)); }

TEST(Golden, AFinishedMovieIsWhatItWasByteForByte) {
    const Recording recording = record();
    const auto recorded = std::span(recording.underWay).subspan(kBeforeMovie);
    expectGolden("finished.txt", test::dumpOf(recording.finished, recorded));
}

TEST(Golden, BothAreRightByTheStrictChecker) {
    const test::TemporaryDirectory folder;
    const Recording recording = record();
    using checkers::BoxShape;
    const auto underWay = checkers::checkBoxes(folder.write("under_way.mp4", recording.underWay), BoxShape::Fragmented);
    EXPECT_EQ(underWay.findings, checkers::Findings{});
    EXPECT_EQ(underWay.fragments, 3U);
    const auto finished = checkers::checkBoxes(folder.write("finished.mp4", recording.finished));
    EXPECT_EQ(finished.findings, checkers::Findings{});
    ASSERT_EQ(finished.tracks.size(), 3U);
    EXPECT_EQ(finished.tracks[0].samples, 7U);
    EXPECT_EQ(finished.tracks[1].samples, 5U);
    EXPECT_EQ(finished.tracks[2].samples, 4U);
    EXPECT_EQ(finished.duration, 1'723'457U);
}

}  // namespace
}  // namespace lumacast::mp4
