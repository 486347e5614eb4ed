// Every state in which a crash leaves a file, recovered and then judged as the finished movie would be.

#include "tests/unit/linux_mp4/Recovery.h"

#include <gtest/gtest.h>

#include <array>
#include <random>
#include <set>

#include "linux/media/mp4/MovieLook.h"
#include "tests/unit/linux_mp4/Times.h"
#include "tests/unit/linux_mp4/Tools.h"

namespace lumacast::mp4 {
namespace {

using test::Bytes;
using test::MemoryFile;
using test::MemorySink;

class MovieRecovery : public ::testing::Test {
protected:
    test::TemporaryDirectory directory;
    MemorySink sink;
    test::Material material;
    std::size_t operationsBeforeFinish = 0;

    // Eight seconds of pictures, six of a sound with priming, and a second sound that joins after two.
    void SetUp() override {
        material.video = test::encodeVideo(test::steadyStamps(200, 25));
        const auto loud = [](std::int64_t time) { return time % kRate < kRate / 4; };
        material.sounds.push_back(test::encodeAudio(0, 6 * kRate, loud, "Application audio"));
        material.sounds.push_back(test::encodeAudio(2 * kRate + 77, 3 * kRate, loud, "Microphone"));
        MovieBoxWriter writer(sink);
        ASSERT_EQ(test::writeMovie(writer, material.video, {&material.sounds[0], &material.sounds[1]}),
                  MovieError::none);
        ASSERT_EQ(writer.flushFragment(), MovieError::none);
        operationsBeforeFinish = sink.operations().size();
        ASSERT_EQ(writer.finish(8 * kSecond), MovieError::none);
    }

    [[nodiscard]] Bytes cutAt(std::uint64_t length) const {
        Bytes file;
        for (std::size_t o = 0; o < operationsBeforeFinish && file.size() < length; ++o) {
            MemorySink::apply(sink.operations()[o], file);
        }
        file.resize(length);
        return file;
    }

    [[nodiscard]] std::vector<std::int64_t> firstStamps(std::size_t count) const {
        std::vector<std::int64_t> stamps;
        for (std::size_t i = 0; i < count; ++i) {
            stamps.push_back(material.video.samples[i].info.pts);
        }
        return stamps;
    }

    // Decodes all of it without a word from the decoder, its boxes agree, and it is known as recovered.
    void expectOrdinaryMovie(const Bytes& movie, std::size_t pictures, const std::string& state) const {
        const auto path = directory.write("recovered.mp4", movie);
        const auto played = test::playStrictly(path);
        EXPECT_EQ(played.status, 0) << state;
        EXPECT_EQ(played.errors, "") << state;
        EXPECT_EQ(played.pictures, firstStamps(pictures)) << state;
        test::expectSoundBoxes(path.string(), state);
    }

    // Recovers it and compares it with what `finish` makes of the same samples.
    Bytes expectRecovered(const Bytes& file, const std::string& state) const {
        const test::Whole whole = test::wholeIn(file, 3);
        MemoryFile movie(file);
        EXPECT_EQ(nameOf(recoverMovie(movie, movie)), nameOf(Recovery::recovered)) << state;
        if (movie.bytes().size() <= file.size()) {
            return movie.bytes();
        }
        test::expectSameMovie(movie.bytes(), test::finishedOf(material, whole), state);
        // Not a byte of the media was touched, and all that was there is still there.
        EXPECT_TRUE(std::equal(file.begin() + 48, file.end(), movie.bytes().begin() + 48)) << state;
        MemoryFile again(movie.bytes());
        const MovieLook look = lookAtMovie(again);
        EXPECT_EQ(nameOf(look.state), "recovered") << state;
        EXPECT_GT(look.nanoseconds.value_or(0), 0) << state;
        EXPECT_EQ(nameOf(recoverMovie(again, again)), nameOf(Recovery::finished)) << state;
        EXPECT_TRUE(again.operations().empty()) << state;
        return movie.bytes();
    }
};

TEST_F(MovieRecovery, OfARecordingThatEndedAtAnyByteHasEverySampleThatIsWhollyThere) {
    const std::uint64_t length = sink.fileAfter(operationsBeforeFinish).size();
    std::mt19937 random(20261122);
    std::set<std::size_t> pictureCounts;
    int hidden = 0;
    for (int i = 0; i < 200; ++i) {
        const std::uint64_t cut = random() % length;
        const std::string state = "cut at " + std::to_string(cut);
        const Bytes file = cutAt(cut);
        const test::Whole whole = test::wholeIn(file, 3);
        if (whole.shownPictures == 0) {
            MemoryFile movie(file);
            const Recovery result = recoverMovie(movie, movie);
            EXPECT_TRUE(result == Recovery::nothingWhole || result == Recovery::notOurs) << nameOf(result) << state;
            EXPECT_TRUE(movie.operations().empty()) << state;
            continue;
        }
        const Bytes movie = expectRecovered(file, state);
        if (i % 10 == 0) {
            expectOrdinaryMovie(movie, whole.samples[0], state);
        }
        pictureCounts.insert(whole.samples[0]);
        hidden += whole.samples[0] > whole.shownPictures ? 1 : 0;
    }
    EXPECT_GE(pictureCounts.size(), 60U) << "the cuts did not reach far enough into the fragments";
    EXPECT_GT(hidden, 60) << "no cut had pictures that no player saw";
}

TEST_F(MovieRecovery, OfARecordingThatEndedAfterAnyOperationHasAllThatWasWritten) {
    std::size_t most = 0;
    for (std::size_t count = 1; count <= operationsBeforeFinish; ++count) {
        const Bytes file = sink.fileAfter(count);
        const test::Whole whole = test::wholeIn(file, 3);
        if (whole.shownPictures == 0) {
            continue;
        }
        const std::string state = "operation " + std::to_string(count);
        const Bytes movie = expectRecovered(file, state);
        if (count % 5 == 0) {
            expectOrdinaryMovie(movie, whole.samples[0], state);
        }
        EXPECT_GE(whole.samples[0], most) << state;
        most = whole.samples[0];
    }
    EXPECT_EQ(most, material.video.samples.size());
}

// A few bytes of a box's header are the one thing behind which nothing can simply be appended.
TEST_F(MovieRecovery, OfARecordingThatEndedWithinTheHeaderOfAFragmentIsAnOrdinaryMovieToo) {
    std::uint64_t start = 0;
    for (const auto& box : test::parseBoxes(sink.fileAfter(operationsBeforeFinish))) {
        start = box.type == "moof" ? box.offset : start;
    }
    for (std::uint64_t part = 0; part <= 20; ++part) {
        const std::string state = std::to_string(part) + " bytes of the last fragment";
        const Bytes file = cutAt(start + part);
        expectOrdinaryMovie(expectRecovered(file, state), test::wholeIn(file, 3).samples[0], state);
    }
}

// The power goes: of what came after the last sync any part is there, zeros for the rest.
TEST_F(MovieRecovery, AfterAPowerCutHasAllThatWasSyncedAndNoZerosForData) {
    const auto& operations = sink.operations();
    std::mt19937 random(77);
    int recovered = 0;
    for (int i = 0; i < 150; ++i) {
        const std::size_t count = 1 + random() % operationsBeforeFinish;
        std::size_t synced = count;
        while (synced > 0 && operations[synced - 1].kind != MemorySink::Kind::sync) {
            --synced;
        }
        Bytes file = sink.fileAfter(synced);
        const std::size_t safe = test::wholeIn(file, 3).shownPictures;
        for (std::size_t o = synced; o < count; ++o) {
            auto operation = operations[o];
            const bool isAppend = operation.kind == MemorySink::Kind::append;
            if (!isAppend && random() % 2 == 0) {
                continue;
            }
            const std::size_t at = file.size();
            MemorySink::apply(operation, file);
            for (std::size_t sector = at / 512 * 512; isAppend && sector < file.size(); sector += 512) {
                if (random() % 4 == 0) {
                    std::fill(file.begin() + static_cast<std::ptrdiff_t>(std::max(sector, at)),
                              file.begin() + static_cast<std::ptrdiff_t>(std::min(sector + 512, file.size())), 0);
                }
            }
        }
        if (safe == 0) {
            continue;
        }
        const std::string state = std::to_string(count) + " operations, " + std::to_string(synced) + " synced";
        MemoryFile movie(file);
        ASSERT_EQ(nameOf(recoverMovie(movie, movie)), nameOf(Recovery::recovered)) << state;
        const auto boxes = test::parseBoxes(movie.bytes());
        for (const auto* trak : boxes.back().all("trak")) {
            const auto track = test::parseTrack(*trak);
            const auto& expected = material.samples(track.id - 1);
            ASSERT_LE(track.samples.size(), expected.size());
            for (std::size_t s = 0; s < track.samples.size(); ++s) {
                const auto& sample = track.samples[s];
                const auto from = movie.bytes().begin() + static_cast<std::ptrdiff_t>(sample.offset);
                ASSERT_EQ(Bytes(from, from + sample.size), expected[s].bytes) << state << ", sample " << s;
            }
            if (track.id == 1) {
                EXPECT_GE(track.samples.size(), safe) << state;
            }
            if (track.id == 1 && i % 8 == 0) {
                expectOrdinaryMovie(movie.bytes(), track.samples.size(), state);
            }
        }
        ++recovered;
    }
    EXPECT_GT(recovered, 100);
}

TEST_F(MovieRecovery, OfARecordingThatEndsInZerosHasAllOfIt) {
    Bytes file = sink.fileAfter(operationsBeforeFinish);
    for (const std::size_t zeros : {1U, 3U, 4U, 7U, 8U, 100'000U}) {
        Bytes longer = file;
        longer.resize(file.size() + zeros, 0);
        const std::string state = std::to_string(zeros) + " zeros";
        expectOrdinaryMovie(expectRecovered(longer, state), material.video.samples.size(), state);
    }
}

TEST_F(MovieRecovery, OfAFinishThatWasCutOffIsWhatTheFinishWouldHaveMade) {
    // The index is whole: only the switch is missing, and the file becomes what it was to be, byte for byte.
    for (std::size_t count = operationsBeforeFinish + 1; count < sink.operations().size() - 1; ++count) {
        MemoryFile movie(sink.fileAfter(count));
        EXPECT_EQ(nameOf(recoverMovie(movie, movie)), nameOf(Recovery::completed));
        EXPECT_EQ(movie.bytes(), sink.file()) << "operation " << count - operationsBeforeFinish;
        for (const auto& operation : movie.operations()) {
            EXPECT_NE(operation.kind, MemorySink::Kind::append);
        }
    }
    // It is not: it is written anew.
    const Bytes recording = sink.fileAfter(operationsBeforeFinish);
    const Bytes& index = sink.operations()[operationsBeforeFinish].bytes;
    std::mt19937 random(5);
    std::vector<std::size_t> lengths{1, 3, 4, 7, 8, 9, 12, 16, 100, index.size() - 1};
    for (int i = 0; i < 20; ++i) {
        lengths.push_back(random() % index.size());
    }
    for (const std::size_t length : lengths) {
        const std::string state = std::to_string(length) + " bytes of the index";
        Bytes file = recording;
        file.insert(file.end(), index.begin(), index.begin() + static_cast<std::ptrdiff_t>(length));
        const Bytes cut = expectRecovered(file, state);
        file.resize(recording.size() + index.size(), 0);
        const Bytes withZeros = expectRecovered(file, state + ", then zeros");
        if (length < 10 || length == 100) {
            expectOrdinaryMovie(cut, material.video.samples.size(), state);
            expectOrdinaryMovie(withZeros, material.video.samples.size(), state + ", then zeros");
        }
    }
}

TEST_F(MovieRecovery, OfASwitchThatWasTornByteByByteIsTheFinishedMovie) {
    const std::size_t switching = sink.operations().size() - 2;
    const auto& operation = sink.operations()[switching];
    ASSERT_EQ(operation.offset, 32U);
    const Bytes before = sink.fileAfter(switching);
    constexpr std::array<std::size_t, 5> kChanging{3, 4, 5, 6, 7};
    for (unsigned subset = 0; subset < 32; ++subset) {
        Bytes torn = before;
        for (std::size_t bit = 0; bit < kChanging.size(); ++bit) {
            if (((subset >> bit) & 1U) != 0) {
                torn[32 + kChanging[bit]] = operation.bytes[kChanging[bit]];
            }
        }
        MemoryFile movie(torn);
        EXPECT_EQ(nameOf(recoverMovie(movie, movie)), nameOf(subset == 31 ? Recovery::finished : Recovery::completed));
        EXPECT_EQ(movie.bytes(), sink.file()) << "bytes " << subset;
    }
}

TEST_F(MovieRecovery, TakesAFragmentWhoseTypeWasTornByteByByte) {
    const std::size_t flip = operationsBeforeFinish - 1;
    const auto& operation = sink.operations()[flip];
    ASSERT_EQ(operation.bytes, (Bytes{'m', 'o', 'o', 'f'}));
    const Bytes whole = sink.fileAfter(operationsBeforeFinish);
    for (unsigned subset = 0; subset < 16; ++subset) {
        Bytes torn = sink.fileAfter(flip);
        for (std::size_t i = 0; i < 4; ++i) {
            if (((subset >> i) & 1U) != 0) {
                torn[operation.offset + i] = operation.bytes[i];
            }
        }
        MemoryFile movie(torn);
        ASSERT_EQ(nameOf(recoverMovie(movie, movie)), nameOf(Recovery::recovered));
        test::expectSameMovie(movie.bytes(), test::finishedOf(material, test::wholeIn(whole, 3)),
                              "bytes " + std::to_string(subset));
    }
}

}  // namespace
}  // namespace lumacast::mp4
