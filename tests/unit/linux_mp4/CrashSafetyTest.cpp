#include <gtest/gtest.h>

#include <random>
#include <set>

#include "tests/unit/linux_mp4/BoxParser.h"
#include "tests/unit/linux_mp4/Media.h"
#include "tests/unit/linux_mp4/Times.h"
#include "tests/unit/linux_mp4/Tools.h"

namespace lumacast::mp4 {
namespace {

using test::Bytes;
using test::MemorySink;

class CrashSafety : public ::testing::Test {
protected:
    test::TemporaryDirectory directory;
    MemorySink sink;
    std::vector<std::int64_t> stamps = test::steadyStamps(200, 25);

    void SetUp() override {
        const auto video = test::encodeVideo(stamps);
        const auto sound = test::encodeAudio(kRate, 6 * kRate, nullptr, "Application audio");
        auto voice = sound;
        voice.samples.clear();
        voice.description.name = "Microphone";
        MovieBoxWriter writer(sink);
        ASSERT_EQ(test::writeMovie(writer, video, {&sound, &voice}), MovieError::none);
        ASSERT_EQ(writer.flushFragment(), MovieError::none);
        operationsBeforeFinish = sink.operations().size();
        ASSERT_EQ(writer.finish(8 * kSecond), MovieError::none);
    }

    void expectWhole(const Bytes& file, const std::string& state) const { expectPictures(stamps.size(), file, state); }

    // The first thing a damaged state must still do, quickly asked: all packets are found at their times.
    [[nodiscard]] bool packetsAreWhole(const Bytes& file) const {
        const auto movie = directory.write("packets.mp4", file);
        const auto result = test::runTool({"ffprobe", "-v", "error", "-select_streams", "v:0", "-show_entries",
                                           "packet=pts", "-of", "csv=p=0", movie.string()});
        std::string expected;
        for (const std::int64_t stamp : stamps) {
            expected += std::to_string(stamp) + "\n";
        }
        return result.status == 0 && result.output == expected && result.errors.empty();
    }

    [[nodiscard]] std::vector<std::int64_t> firstStamps(std::size_t count) const {
        return {stamps.begin(), stamps.begin() + static_cast<std::ptrdiff_t>(count)};
    }

    // So many pictures decode, without a word from the decoder, and at their times.
    void expectPictures(std::size_t count, const Bytes& file, const std::string& state) const {
        const auto played = test::playStrictly(directory.write("state.mp4", file));
        EXPECT_EQ(played.status, 0) << state;
        EXPECT_EQ(played.errors, "") << state;
        EXPECT_EQ(played.pictures, firstStamps(count)) << state;
    }

    std::size_t operationsBeforeFinish = 0;
};

// Pictures in the fragments that are wholly in the file, and where the last of them ends.
struct WholeFragments {
    std::size_t pictures = 0;
    std::uint64_t end = 0;
};
WholeFragments wholeFragments(const Bytes& file) {
    WholeFragments found;
    const auto boxes = test::parseWholeBoxes(file);
    for (std::size_t i = 0; i + 1 < boxes.size(); ++i) {
        if (boxes[i].type != "moof") {
            continue;
        }
        for (const auto& run : test::parseFragment(boxes[i])) {
            found.pictures += run.trackId == 1 ? run.samples.size() : 0;
        }
        found.end = boxes[i + 1].offset + boxes[i + 1].size;
    }
    return found;
}

// Killed or out of space at any byte of any write: all that was whole decodes, and the decoder has nothing to complain
// about.
TEST_F(CrashSafety, ARecordingThatEndsAtAnyByteOfItsWritingPlaysAllItsWholeFragments) {
    const std::uint64_t length = sink.fileAfter(operationsBeforeFinish).size();
    std::mt19937 random(20240229);
    std::set<std::size_t> pictureCounts;
    int played = 0;
    for (int i = 0; i < 200; ++i) {
        const std::uint64_t cut = random() % length;
        Bytes file;
        for (std::size_t o = 0; o < operationsBeforeFinish && file.size() < cut; ++o) {
            MemorySink::apply(sink.operations()[o], file);
        }
        file.resize(cut);
        const WholeFragments whole = wholeFragments(file);
        if (whole.pictures == 0) {
            continue;
        }
        expectPictures(whole.pictures, file, "cut at " + std::to_string(cut));
        pictureCounts.insert(whole.pictures);
        ++played;
    }
    EXPECT_GT(played, 150);
    EXPECT_GE(pictureCounts.size(), 7U) << "the cuts did not reach every fragment";
}

TEST_F(CrashSafety, EveryOperationOfTheRecordingLeavesAMovieThatPlaysAllItsWholeFragments) {
    std::size_t largest = 0;
    for (std::size_t count = 1; count <= operationsBeforeFinish; ++count) {
        const Bytes file = sink.fileAfter(count);
        const WholeFragments whole = wholeFragments(file);
        EXPECT_GE(whole.pictures, largest) << "operation " << count << " took something away";
        largest = std::max(largest, whole.pictures);
        if (whole.pictures == 0) {
            continue;
        }
        expectPictures(whole.pictures, file, "operation " + std::to_string(count));
    }
    EXPECT_EQ(largest, stamps.size());
}

// The power goes at some operation: what was before the last sync is there, of what came after any part. Bytes that did
// not reach the disk are zeros where later ones did.
TEST_F(CrashSafety, APowerCutLosesNothingThatWasShownBeforeTheLastSync) {
    const auto& operations = sink.operations();
    std::mt19937 random(99);
    int played = 0;
    for (int i = 0; i < 150; ++i) {
        const std::size_t count = 1 + random() % operations.size();
        std::size_t synced = count;
        while (synced > 0 && operations[synced - 1].kind != MemorySink::Kind::sync) {
            --synced;
        }
        Bytes file = sink.fileAfter(synced);
        const WholeFragments safe = wholeFragments(file);
        const bool isFinished = test::typesOf(test::parseWholeBoxes(file)) == "ftyp mdat moov";
        std::size_t onDisk = file.size();
        for (std::size_t o = synced; o < count; ++o) {
            auto operation = operations[o];
            const bool isAppend = operation.kind == MemorySink::Kind::append;
            if (random() % 2 == 0) {
                operation.bytes.assign(isAppend ? operation.bytes.size() : 0, 0);
            } else if (isAppend) {
                onDisk = file.size() + operation.bytes.size();
            }
            MemorySink::apply(operation, file);
        }
        file.resize(random() % 2 == 0 ? onDisk : file.size());
        if (safe.pictures == 0 && !isFinished) {
            continue;
        }
        const std::string state = std::to_string(count) + " operations, " + std::to_string(synced) + " synced";
        const auto shown = test::playStrictly(directory.write("power.mp4", file));
        EXPECT_EQ(shown.status, 0) << state;
        EXPECT_EQ(shown.errors, "") << state;
        EXPECT_GE(shown.pictures.size(), isFinished ? stamps.size() : safe.pictures) << state;
        EXPECT_EQ(shown.pictures, firstStamps(shown.pictures.size())) << state;
        ++played;
    }
    EXPECT_GT(played, 100);
}

// Somebody else's cut, through fragments that are visible already. Inside a movie fragment box it is beyond our help:
// the reference player then refuses the file. It can't come from a crash, as the test before shows.
TEST_F(CrashSafety, ARecordingShortenedAfterwardsPlaysUnlessAFragmentBoxItselfIsCut) {
    const Bytes recording = sink.fileAfter(operationsBeforeFinish);
    std::mt19937 random(4);
    const auto boxes = test::parseBoxes(recording);
    int played = 0;
    for (int i = 0; i < 60; ++i) {
        const std::size_t length = random() % (recording.size() + 1);
        const Bytes cut(recording.begin(), recording.begin() + static_cast<std::ptrdiff_t>(length));
        const WholeFragments whole = wholeFragments(cut);
        const bool cutsFragmentBox = std::any_of(boxes.begin(), boxes.end(), [length](const auto& box) {
            return box.type == "moof" && box.offset < length && length < box.offset + box.size;
        });
        if (whole.pictures == 0 || cutsFragmentBox) {
            continue;
        }
        const auto movie = directory.write("cut.mp4", cut);
        const auto shown = test::play(movie);
        EXPECT_EQ(shown.status, 0) << "cut at " << length << ": " << shown.errors;
        // A player may show what it finds of the fragment that was cut as well.
        ASSERT_GE(shown.pictures.size(), whole.pictures) << "cut at " << length;
        const std::vector<std::int64_t> first(shown.pictures.begin(),
                                              shown.pictures.begin() + static_cast<std::ptrdiff_t>(whole.pictures));
        EXPECT_EQ(first, firstStamps(whole.pictures)) << "cut at " << length;
        ++played;
    }
    EXPECT_GT(played, 40);
}

TEST_F(CrashSafety, ARecordingThatEndsInZerosPlays) {
    Bytes file = sink.fileAfter(operationsBeforeFinish);
    file.resize(file.size() + 100'000, 0);  // what some disks leave of a write that was never synced
    expectWhole(file, "zeros at the end");
}

TEST_F(CrashSafety, EveryStepOfTheFinishLeavesAMovieThatPlaysWhole) {
    const std::size_t operations = sink.operations().size();
    ASSERT_EQ(operations - operationsBeforeFinish, 5U) << "append, size, sync, header, sync";
    for (std::size_t count = operationsBeforeFinish; count <= operations; ++count) {
        expectWhole(sink.fileAfter(count), "after operation " + std::to_string(count - operationsBeforeFinish));
    }
    const auto before = sink.fileAfter(operations - 2);
    EXPECT_EQ(test::typesOf(test::parseBoxes(before)).substr(0, 14), "ftyp free moov");
    EXPECT_EQ(test::typesOf(test::parseBoxes(sink.file())), "ftyp mdat moov");
}

TEST_F(CrashSafety, AnIndexThatIsWrittenInPartLeavesARecordingThatPlaysWhole) {
    const Bytes recording = sink.fileAfter(operationsBeforeFinish);
    const Bytes& index = sink.operations()[operationsBeforeFinish].bytes;
    ASSERT_EQ(sink.operations()[operationsBeforeFinish].kind, MemorySink::Kind::append);
    std::mt19937 random(5);
    std::vector<std::size_t> lengths{1, 4, 7, 8, 9, 12, 16, 100, index.size() - 1};
    for (int i = 0; i < 20; ++i) {
        lengths.push_back(random() % index.size());
    }
    for (const std::size_t length : lengths) {
        Bytes file = recording;
        file.insert(file.end(), index.begin(), index.begin() + static_cast<std::ptrdiff_t>(length));
        EXPECT_TRUE(packetsAreWhole(file)) << length << " bytes of the index";
        file.resize(recording.size() + index.size(), 0);
        EXPECT_TRUE(packetsAreWhole(file)) << length << " bytes of the index, then zeros";
    }
}

// Each overwrite may reach the disk in any order of its bytes: every subset of the bytes that change is tried.
TEST_F(CrashSafety, OverwritesTornByteByByteLeaveAMovieThatPlaysWhole) {
    std::size_t states = 0;
    for (std::size_t count = operationsBeforeFinish; count < sink.operations().size(); ++count) {
        const auto& operation = sink.operations()[count];
        if (operation.kind != MemorySink::Kind::overwrite) {
            continue;
        }
        const Bytes before = sink.fileAfter(count);
        std::vector<std::size_t> changing;
        for (std::size_t i = 0; i < operation.bytes.size(); ++i) {
            if (before[operation.offset + i] != operation.bytes[i]) {
                changing.push_back(i);
            }
        }
        ASSERT_GE(changing.size(), 2U);
        ASSERT_LE(changing.size(), 6U);
        EXPECT_EQ(operation.offset / 512, (operation.offset + operation.bytes.size() - 1) / 512) << "within a sector";
        for (unsigned subset = 0; subset < (1U << changing.size()); ++subset) {
            Bytes torn = before;
            for (std::size_t bit = 0; bit < changing.size(); ++bit) {
                if (((subset >> bit) & 1U) != 0) {
                    torn[operation.offset + changing[bit]] = operation.bytes[changing[bit]];
                }
            }
            EXPECT_TRUE(packetsAreWhole(torn)) << "operation " << count << ", bytes " << subset;
            ++states;
        }
    }
    EXPECT_GE(states, 32U);
}

TEST_F(CrashSafety, AFragmentsTypeTornByteByByteShowsTheFragmentOrNot) {
    const std::size_t flip = operationsBeforeFinish - 1;  // of the last fragment
    const auto& operation = sink.operations()[flip];
    ASSERT_EQ(operation.kind, MemorySink::Kind::overwrite);
    ASSERT_EQ(operation.bytes, (Bytes{'m', 'o', 'o', 'f'}));
    const std::size_t without = wholeFragments(sink.fileAfter(flip)).pictures;
    ASSERT_LT(without, stamps.size());
    for (unsigned subset = 0; subset < 16; ++subset) {
        Bytes torn = sink.fileAfter(flip);
        for (std::size_t i = 0; i < 4; ++i) {
            if (((subset >> i) & 1U) != 0) {
                torn[operation.offset + i] = operation.bytes[i];
            }
        }
        expectPictures(subset == 15 ? stamps.size() : without, torn, "bytes " + std::to_string(subset));
    }
}

TEST_F(CrashSafety, TheIndexIsOnTheDiskBeforeTheFileIsSwitchedToIt) {
    const auto& operations = sink.operations();
    using Kind = MemorySink::Kind;
    std::vector<Kind> kinds;
    for (std::size_t i = operationsBeforeFinish; i < operations.size(); ++i) {
        kinds.push_back(operations[i].kind);
    }
    EXPECT_EQ(kinds, (std::vector<Kind>{Kind::append, Kind::overwrite, Kind::sync, Kind::overwrite, Kind::sync}));
    EXPECT_EQ(operations[operationsBeforeFinish + 1].offset, 40U);
    EXPECT_EQ(operations[operationsBeforeFinish + 3].offset, 32U);
    EXPECT_EQ(operations[operationsBeforeFinish + 3].bytes, (Bytes{0, 0, 0, 1, 'm', 'd', 'a', 't'}));
}

}  // namespace
}  // namespace lumacast::mp4
