#include "tests/checkers/BoxChecker.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <functional>

#include "tests/checkers/tests/MovieMaker.h"
#include "tests/checkers/tests/TestFolder.h"

namespace lumacast::checkers {
namespace {

using Bytes = std::vector<char>;

std::uint32_t numberAt(const Bytes& bytes, std::size_t place) {
    std::uint32_t value = 0;
    for (std::size_t byte = 0; byte < 4; ++byte) value = value << 8 | static_cast<std::uint8_t>(bytes[place + byte]);
    return value;
}

void setNumber(Bytes& bytes, std::size_t place, std::uint32_t value) {
    for (std::size_t byte = 0; byte < 4; ++byte) bytes[place + byte] = static_cast<char>(value >> (24 - 8 * byte));
}

void addTo(Bytes& bytes, std::size_t place, std::uint32_t value) {
    setNumber(bytes, place, numberAt(bytes, place) + value);
}

// Where the n-th box of this type begins; the index stands at the end of the movies made here.
std::size_t boxAt(const Bytes& bytes, const std::string& type, int place = 0) {
    auto from = bytes.begin();
    if (type != "ftyp" && type != "mdat" && type != "moov") from += static_cast<std::ptrdiff_t>(boxAt(bytes, "moov"));
    if (type == "moov")
        from = bytes.end() - std::min<std::ptrdiff_t>(20'000, static_cast<std::ptrdiff_t>(bytes.size()));
    for (;; ++from) {
        from = std::search(from, bytes.end(), type.begin(), type.end());
        if (from == bytes.end()) {
            ADD_FAILURE() << "no box " << type;
            return 0;
        }
        if (place-- == 0) return static_cast<std::size_t>(from - bytes.begin()) - 4;
    }
}

void rename(Bytes& bytes, const std::string& from, const std::string& to, int place = 0) {
    std::copy(to.begin(), to.end(), bytes.begin() + static_cast<std::ptrdiff_t>(boxAt(bytes, from, place) + 4));
}

void append(Bytes& bytes, const std::string& type, std::size_t content) {
    const std::size_t before = bytes.size();
    bytes.resize(before + 8 + content);
    setNumber(bytes, before, static_cast<std::uint32_t>(8 + content));
    std::copy(type.begin(), type.end(), bytes.begin() + static_cast<std::ptrdiff_t>(before + 4));
}

class BoxCheckerTest : public ::testing::Test {
protected:
    void SetUp() override {
        MoviePlan plan;
        plan.pictures = steadyPictures(1, 45, 30);
        plan.soundSeconds = 1.5;
        plan.sound = [](double) { return 0.0F; };
        ASSERT_EQ(makeMovie(plan, path_), "");
        good_ = bytesOf(path_);
    }

    BoxReport check(const Bytes& bytes) {
        writeBytes(path_, bytes);
        return checkBoxes(path_);
    }

    TestFolder folder_;
    std::string path_ = folder_.file("movie.mp4");
    Bytes good_;
};

TEST_F(BoxCheckerTest, AcceptsAGoodMovieAndTellsItsTracks) {
    const BoxReport report = check(good_);
    EXPECT_EQ(report.findings, Findings{});
    EXPECT_EQ(report.topLevel.front(), "ftyp");
    EXPECT_EQ(report.topLevel.back(), "moov");
    ASSERT_EQ(report.tracks.size(), 2U);
    EXPECT_EQ(report.tracks[0].handler, "vide");
    EXPECT_EQ(report.tracks[0].codec, "avc1");
    EXPECT_EQ(report.tracks[0].samples, 45U);
    EXPECT_EQ(report.tracks[0].syncSamples, 2U);
    EXPECT_EQ(report.tracks[0].timescale, 90000U);
    EXPECT_EQ(report.tracks[0].mediaDuration, 45 * 3000U);
    EXPECT_EQ(report.tracks[1].handler, "soun");
    EXPECT_EQ(report.tracks[1].codec, "mp4a");
    EXPECT_EQ(report.tracks[1].syncSamples, report.tracks[1].samples);
    EXPECT_EQ(report.duration, 1500U);
    EXPECT_EQ(report.timescale, 1000U);
}

TEST_F(BoxCheckerTest, AcceptsAMovieWithReorderedPictures) {
    MoviePlan plan;
    plan.pictures = steadyPictures(1, 45, 30);
    plan.reordered = true;
    ASSERT_EQ(makeMovie(plan, path_), "");
    EXPECT_EQ(checkBoxes(path_).findings, Findings{});
}

TEST_F(BoxCheckerTest, RejectsEachWayOfBreakingTheMovie) {
    struct Damage {
        const char* what;
        const char* finding;
        std::function<void(Bytes&)> doctor;
    };
    // Offsets within a box count its header of 8 bytes and its version of 4.
    const std::vector<Damage> damages{
        {"truncated", "doesn't fit into the file", [](Bytes& b) { b.resize(b.size() - 1); }},
        {"junk at the end", "doesn't fit into the file", [](Bytes& b) { b.insert(b.end(), 5, 'x'); }},
        {"index too long", "doesn't fit into the file", [](Bytes& b) { addTo(b, boxAt(b, "moov"), 1); }},
        {"media too long", "doesn't fit into the file", [](Bytes& b) { addTo(b, boxAt(b, "mdat"), 1 << 30); }},
        {"media to the end", "doesn't fit into the file", [](Bytes& b) { setNumber(b, boxAt(b, "mdat"), 0); }},
        {"no ftyp", "ftyp isn't first", [](Bytes& b) { rename(b, "ftyp", "free"); }},
        {"no index", "0 moov boxes", [](Bytes& b) { rename(b, "moov", "free"); }},
        {"two indexes", "2 moov boxes", [](Bytes& b) { append(b, "moov", 0); }},
        {"two ftyp", "several ftyp", [](Bytes& b) { append(b, "ftyp", 8); }},
        {"a fragment", "a moof of a fragmented file", [](Bytes& b) { append(b, "moof", 16); }},
        {"a fragment index", "a mfra of a fragmented file", [](Bytes& b) { append(b, "mfra", 16); }},
        {"fragments announced", "an mvex box", [](Bytes& b) { rename(b, "udta", "mvex"); }},
        {"a box within too long", "doesn't fit where it is", [](Bytes& b) { addTo(b, boxAt(b, "dinf"), 4); }},
        {"a box within too short", "doesn't fit where it is", [](Bytes& b) { setNumber(b, boxAt(b, "stbl"), 7); }},
        {"no sample sizes", "0 stsz boxes", [](Bytes& b) { rename(b, "stsz", "free"); }},
        {"no chunk offsets", "no table of chunk offsets", [](Bytes& b) { rename(b, "stco", "free"); }},
        {"no decoder configuration", "0 avcC boxes", [](Bytes& b) { rename(b, "avcC", "free"); }},
        {"no audio configuration", "0 esds boxes", [](Bytes& b) { rename(b, "esds", "free"); }},
        {"no media header", "0 vmhd boxes", [](Bytes& b) { rename(b, "vmhd", "free"); }},
        {"two sample entries", "exactly one sample entry", [](Bytes& b) { addTo(b, boxAt(b, "stsd") + 12, 1); }},
        {"a time too many", "stts has times for 46", [](Bytes& b) { addTo(b, boxAt(b, "stts") + 16, 1); }},
        {"times longer", "mdhd says", [](Bytes& b) { addTo(b, boxAt(b, "stts") + 20, 1); }},
        {"times of zero", "samples of no duration", [](Bytes& b) { setNumber(b, boxAt(b, "stts") + 20, 0); }},
        {"times of another count", "stts has another size", [](Bytes& b) { addTo(b, boxAt(b, "stts") + 12, 1); }},
        {"sizes of another count", "stsz has another size", [](Bytes& b) { addTo(b, boxAt(b, "stsz") + 16, 1); }},
        {"a sample too large", "overlap", [](Bytes& b) { addTo(b, boxAt(b, "stsz") + 20, 4096); }},
        {"an empty sample", "sample 1 is empty", [](Bytes& b) { setNumber(b, boxAt(b, "stsz") + 20, 0); }},
        {"chunks hold more", "samples in its chunks", [](Bytes& b) { addTo(b, boxAt(b, "stsc") + 20, 1); }},
        {"chunks begin late", "out of order or not there", [](Bytes& b) { setNumber(b, boxAt(b, "stsc") + 16, 2); }},
        {"another sample entry", "a sample entry that isn't there",
         [](Bytes& b) { addTo(b, boxAt(b, "stsc") + 24, 1); }},
        {"a chunk outside", "isn't within the media data", [](Bytes& b) { addTo(b, boxAt(b, "stco") + 16, 1 << 24); }},
        {"a chunk before the media", "isn't within the media data",
         [](Bytes& b) { setNumber(b, boxAt(b, "stco") + 16, 8); }},
        {"sync samples late", "first sample isn't a sync sample",
         [](Bytes& b) { setNumber(b, boxAt(b, "stss") + 16, 2); }},
        {"sync samples not there", "stss names samples", [](Bytes& b) { setNumber(b, boxAt(b, "stss") + 20, 46); }},
        {"media duration", "mdhd says", [](Bytes& b) { addTo(b, boxAt(b, "mdhd") + 24, 1); }},
        {"media time scale", "an edit reaches beyond", [](Bytes& b) { addTo(b, boxAt(b, "mdhd", 1) + 20, 10'000); }},
        {"track duration", "tkhd says", [](Bytes& b) { addTo(b, boxAt(b, "tkhd") + 28, 40); }},
        {"no edits and another duration", "the media lasts 1500, tkhd says 1540",
         [](Bytes& b) {
             rename(b, "edts", "free");
             addTo(b, boxAt(b, "tkhd") + 28, 40);
         }},
        {"movie duration", "mvhd says", [](Bytes& b) { addTo(b, boxAt(b, "mvhd") + 24, 1); }},
        {"edit too long", "an edit reaches beyond", [](Bytes& b) { addTo(b, boxAt(b, "elst") + 16, 40); }},
        {"edit begins late", "an edit reaches beyond", [](Bytes& b) { addTo(b, boxAt(b, "elst") + 20, 9000); }},
        {"edit slows down", "changes the speed", [](Bytes& b) { setNumber(b, boxAt(b, "elst") + 24, 0x8000); }},
        {"one identifier twice", "same identifier", [](Bytes& b) { setNumber(b, boxAt(b, "tkhd", 1) + 20, 1); }},
    };
    for (const Damage& damage : damages) {
        Bytes bytes = good_;
        damage.doctor(bytes);
        ASSERT_NE(bytes, good_) << damage.what;
        const BoxReport report = check(bytes);
        std::string all;
        for (const std::string& finding : report.findings) all += finding + "\n";
        EXPECT_NE(all.find(damage.finding), std::string::npos) << damage.what << " gave:\n" << all;
    }
}

TEST_F(BoxCheckerTest, RejectsAFileThatIsNoMovie) {
    EXPECT_FALSE(check({}).findings.empty());
    EXPECT_FALSE(check(Bytes(5000, 'x')).findings.empty());
    EXPECT_FALSE(checkBoxes(folder_.file("none.mp4")).findings.empty());
}

TEST_F(BoxCheckerTest, AnyByteOfTheIndexOverwrittenEndsTheWalkInOrder) {
    // No verdict is expected, only that a damaged index is never read beyond its end (the sanitizers watch).
    const std::size_t index = boxAt(good_, "moov");
    for (std::size_t place = index; place < good_.size(); place += 3) {
        Bytes bytes = good_;
        bytes[place] = static_cast<char>(0xFF);
        (void)check(bytes);
    }
}

}  // namespace
}  // namespace lumacast::checkers
