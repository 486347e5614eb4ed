// A recovery that is cut off in turn, and files that a recovery must leave as they are.

#include <gtest/gtest.h>

#include <algorithm>
#include <random>

#include "linux/media/mp4/MovieLook.h"
#include "tests/unit/linux_mp4/Descriptions.h"
#include "tests/unit/linux_mp4/Recovery.h"
#include "tests/unit/linux_mp4/Times.h"
#include "tests/unit/linux_mp4/Tools.h"

namespace lumacast::mp4 {
namespace {

using test::Bytes;
using test::MemoryFile;
using test::MemorySink;

Bytes recordingOf(const test::Material& material) {
    MemorySink sink;
    MovieBoxWriter writer(sink);
    std::vector<const test::EncodedAudio*> sounds;
    for (const auto& sound : material.sounds) {
        sounds.push_back(&sound);
    }
    EXPECT_EQ(test::writeMovie(writer, material.video, sounds), MovieError::none);
    EXPECT_EQ(writer.flushFragment(), MovieError::none);
    return sink.file();
}

class InterruptedRecovery : public ::testing::Test {
protected:
    test::TemporaryDirectory directory;
    test::Material material;
    Bytes recording;

    void SetUp() override {
        material.video = test::encodeVideo(test::steadyStamps(75, 25));
        material.sounds.push_back(test::encodeAudio(0, 3 * kRate, nullptr, "Application audio"));
        recording = recordingOf(material);
    }

    // What a player finds of the pictures.
    [[nodiscard]] std::string packetsOf(const Bytes& file) const {
        const auto movie = directory.write("packets.mp4", file);
        const auto result = test::runTool({"ffprobe", "-v", "error", "-select_streams", "v:0", "-show_entries",
                                           "packet=pts", "-of", "csv=p=0", movie.string()});
        return result.output + result.errors + std::to_string(result.status);
    }
};

TEST_F(InterruptedRecovery, AtAnyByteLeavesTheFilePlayingAsBeforeAndTheNextOneFinishesIt) {
    std::mt19937 random(3);
    std::vector<std::uint64_t> fragments;
    for (const auto& box : test::parseBoxes(recording)) {
        if (box.type == "moof") {
            fragments.push_back(box.offset);
        }
    }
    const std::uint64_t header = fragments.back();
    // Behind a whole fragment that is not shown yet, in its samples, in its box, in the header of that.
    for (const std::uint64_t cut : {recording.size(), (header + recording.size()) / 2, header + 3, header + 6, header + 50}) {
        Bytes crashed(recording.begin(), recording.begin() + static_cast<std::ptrdiff_t>(cut));
        if (cut > header + 8) {
            std::copy_n("free", 4, crashed.begin() + static_cast<std::ptrdiff_t>(header) + 4);
        }
        {
            SCOPED_TRACE("crashed at " + std::to_string(cut));
            const std::string before = packetsOf(crashed);
            MemoryFile whole(crashed);
            ASSERT_EQ(nameOf(recoverMovie(whole, whole)), nameOf(Recovery::recovered));
            const std::size_t appended = whole.bytes().size() - crashed.size();
            std::vector<std::size_t> stops{0, 1, 4, 7, 8, 9, 16, appended - 1};
            for (int i = 0; i < 6; ++i) {
                stops.push_back(random() % appended);
            }
            for (const std::size_t stop : stops) {
                MemoryFile full(crashed);
                full.bytesUntilFull = stop;
                ASSERT_EQ(nameOf(recoverMovie(full, full)), nameOf(Recovery::sinkFailed));
                ASSERT_EQ(full.bytes().size(), crashed.size() + stop);
                EXPECT_EQ(packetsOf(full.bytes()), before) << "stopped after " << stop;
                MemoryFile next(full.bytes());
                ASSERT_EQ(nameOf(recoverMovie(next, next)), nameOf(Recovery::recovered)) << stop;
                test::expectSameMovie(next.bytes(), whole.bytes(), "stopped after " + std::to_string(stop));
                Bytes zeros = full.bytes();
                zeros.resize(crashed.size() + appended, 0);
                MemoryFile afterPowerCut(zeros);
                const Recovery last = recoverMovie(afterPowerCut, afterPowerCut);  // an index may end in zeros
                EXPECT_TRUE(last == Recovery::recovered || last == Recovery::completed) << stop << nameOf(last);
                test::expectSameMovie(afterPowerCut.bytes(), whole.bytes(), "power cut after " + std::to_string(stop));
            }
            for (std::size_t count = 1; count < whole.operations().size(); ++count) {
                const Bytes state = whole.after(count);
                const bool isSwitched = test::typesOf(test::parseWholeBoxes(state)) == "ftyp mdat moov";
                EXPECT_EQ(packetsOf(state), isSwitched ? packetsOf(whole.bytes()) : before) << "operation " << count;
                MemoryFile next(state);
                const Recovery result = recoverMovie(next, next);
                EXPECT_TRUE(result == Recovery::recovered || result == Recovery::completed ||
                            result == Recovery::finished) << nameOf(result);
                test::expectSameMovie(next.bytes(), whole.bytes(), "operation " + std::to_string(count));
            }
        }
    }
}

// While the index is appended and not switched to, a reader walks from box to box: none may begin in the middle of it.
TEST_F(InterruptedRecovery, HasNoBoxBeginInTheMiddleOfItsIndex) {
    std::uint64_t header = 0;
    for (const auto& box : test::parseBoxes(recording)) {
        header = box.type == "moof" ? box.offset : header;
    }
    for (std::uint64_t cut = header + 1; cut < recording.size(); cut += cut < header + 24 ? 1 : 371) {
        Bytes crashed(recording.begin(), recording.begin() + static_cast<std::ptrdiff_t>(cut));
        std::copy_n("free", std::clamp<std::int64_t>(static_cast<std::int64_t>(cut - header) - 4, 0, 4),
                    crashed.begin() + static_cast<std::ptrdiff_t>(std::min(header + 4, cut)));
        MemoryFile movie(crashed);
        ASSERT_EQ(nameOf(recoverMovie(movie, movie)), nameOf(Recovery::recovered));
        std::size_t appends = 0;
        while (movie.operations()[appends].kind == MemorySink::Kind::append) {
            ++appends;
        }
        const Bytes state = movie.after(appends);
        const std::uint64_t index = movie.operations()[appends - 1].offset;
        std::uint64_t at = 0;
        while (at < state.size()) {
            ASSERT_TRUE(at <= index) << "cut at " << cut - header << ": a box begins " << at - index << " in the index";
            const std::uint64_t size = test::Fields(std::span(state).subspan(at)).u32();
            at = size < 8 ? state.size() : at + size;
        }
    }
}

TEST_F(InterruptedRecovery, TornInItsOverwritesPlaysAsBeforeOrAfter) {
    MemoryFile whole(recording);
    ASSERT_EQ(nameOf(recoverMovie(whole, whole)), nameOf(Recovery::recovered));
    const std::string packets = packetsOf(recording);
    int states = 0;
    for (std::size_t count = 0; count < whole.operations().size(); ++count) {
        const auto& operation = whole.operations()[count];
        if (operation.kind != MemorySink::Kind::overwrite) {
            continue;
        }
        const Bytes before = whole.after(count);
        for (unsigned subset = 0; subset < 256; subset += operation.offset == 32 ? 8 : 1) {
            Bytes torn = before;
            for (std::size_t i = 0; i < 8; ++i) {
                if (((subset >> i) & 1U) != 0) {
                    torn[operation.offset + i] = operation.bytes[i];
                }
            }
            if (torn == before) {
                continue;
            }
            if (++states % 4 == 0) {
                EXPECT_EQ(packetsOf(torn), packets) << "operation " << count << ", bytes " << subset;
            }
            MemoryFile next(torn);
            (void)recoverMovie(next, next);
            test::expectSameMovie(next.bytes(), whole.bytes(), "bytes " + std::to_string(subset));
        }
    }
    EXPECT_GE(states, 60);
}

class Untouched : public InterruptedRecovery {
protected:
    static void expectUntouched(const Bytes& file, Recovery expected, const std::string& state) {
        MemoryFile movie(file);
        EXPECT_EQ(nameOf(recoverMovie(movie, movie)), nameOf(expected)) << state;
        EXPECT_TRUE(movie.operations().empty()) << state;
    }
    // With the bytes of a type found anywhere in the file.
    static void put(Bytes& file, std::uint64_t offset, const Bytes& bytes) {
        std::copy(bytes.begin(), bytes.end(), file.begin() + static_cast<std::ptrdiff_t>(offset));
    }
};

TEST_F(Untouched, IsWhatIsNotAMovieOfThisWriter) {
    expectUntouched({}, Recovery::notOurs, "nothing");
    expectUntouched(Bytes(47, 0), Recovery::notOurs, "zeros");
    expectUntouched(Bytes(100'000, 'x'), Recovery::notOurs, "a text");
    Bytes other = recording;
    put(other, 8, {'q', 't', ' ', ' '});
    expectUntouched(other, Recovery::notOurs, "another brand");
    // Anything that this writer would not have written into the movie box; changes of what it may say are its own.
    const auto boxes = test::parseBoxes(recording);
    const auto& movie = boxes[2];
    int refused = 0;
    for (std::uint64_t at = movie.offset; at < movie.offset + movie.size; ++at) {
        Bytes changed = recording;
        changed[at] ^= 0x40U;
        MemoryFile file(changed);
        const Recovery result = recoverMovie(file, file);
        refused += result == Recovery::recovered ? 0 : 1;
        EXPECT_EQ(result == Recovery::recovered, !file.operations().empty());
    }
    EXPECT_GT(refused, static_cast<int>(movie.size) / 2);
}

TEST_F(Untouched, IsWhatHasNoWholeFragment) {
    const auto boxes = test::parseBoxes(recording);
    put(recording, boxes[3].offset + 4, {'f', 'r', 'e', 'e'});
    for (std::uint64_t length = 0; length < boxes[4].offset + boxes[4].size; length += 97) {
        const Bytes cut(recording.begin(), recording.begin() + static_cast<std::ptrdiff_t>(length));
        MemoryFile movie(cut);
        const Recovery result = recoverMovie(movie, movie);
        EXPECT_TRUE(result == Recovery::nothingWhole || result == Recovery::notOurs) << length << nameOf(result);
        EXPECT_TRUE(movie.operations().empty());
    }
}

// Players show the later fragments: an index without them would be less than the file has now.
TEST_F(Untouched, IsWhatHasDamageInTheMiddle) {
    const auto boxes = test::parseBoxes(recording);
    ASSERT_GT(boxes.size(), 8U);
    const auto& fragment = boxes[5];
    ASSERT_EQ(fragment.type, "moof");
    int damaged = 0;
    for (std::uint64_t at = fragment.offset; at < fragment.offset + fragment.size; ++at) {
        Bytes changed = recording;
        changed[at] ^= 0x55U;
        MemoryFile file(changed);
        const Recovery result = recoverMovie(file, file);
        if (result == Recovery::recovered) {
            // A duration or a time that could have been: every sample is there all the same.
            const auto parsed = test::parseBoxes(file.bytes());
            for (const auto* trak : parsed.back().all("trak")) {
                const auto track = test::parseTrack(*trak);
                EXPECT_EQ(track.samples.size(), material.samples(track.id - 1).size()) << at - fragment.offset;
            }
        } else {
            EXPECT_EQ(nameOf(result), "damaged") << at - fragment.offset;
            EXPECT_TRUE(file.operations().empty());
            ++damaged;
        }
    }
    EXPECT_GT(damaged, 100);
}

TEST_F(Untouched, IsWhatCanNotBeRead) {
    MemoryFile movie(recording);
    movie.isUnreadable = true;
    EXPECT_EQ(nameOf(recoverMovie(movie, movie)), "source failed");
    EXPECT_TRUE(movie.operations().empty());
    EXPECT_EQ(nameOf(lookAtMovie(movie).state), "other");
}

TEST_F(Untouched, IsACopyAndNobodySeesItBeforeItsFinish) {
    MemorySink sink;
    MovieOptions options;
    options.purpose = MoviePurpose::copy;
    options.presentationStart = kSecond / 2 * 1000;
    MovieBoxWriter writer(sink, options);
    ASSERT_EQ(test::writeMovie(writer, material.video, {&material.sounds[0]}), MovieError::none);
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    const std::size_t operations = sink.operations().size();
    for (std::size_t count = 1; count <= operations; ++count) {
        EXPECT_EQ(sink.operations()[count - 1].kind, MemorySink::Kind::append);
        const Bytes file = sink.fileAfter(count);
        MemoryFile movie(file);
        const Recovery result = recoverMovie(movie, movie);
        EXPECT_TRUE(result == Recovery::unfinishedCopy || (count == 1 && result == Recovery::nothingWhole));
        EXPECT_TRUE(movie.operations().empty());
        EXPECT_TRUE(test::playStrictly(directory.write("copy.mp4", file)).pictures.empty()) << count;
        if (count > 1) {
            EXPECT_EQ(nameOf(lookAtMovie(movie).state), "unfinished copy");
        }
    }
    ASSERT_EQ(writer.finish(3 * kSecond), MovieError::none);
    MemoryFile movie(sink.file());
    EXPECT_EQ(nameOf(lookAtMovie(movie).state), "finished");
    EXPECT_EQ(lookAtMovie(movie).nanoseconds, 2'500'000'000);
    EXPECT_EQ(nameOf(recoverMovie(movie, movie)), "finished");
    EXPECT_FALSE(test::playStrictly(directory.write("copy.mp4", sink.file())).pictures.empty());
}

}  // namespace
}  // namespace lumacast::mp4
