#include <gtest/gtest.h>

#include "tests/checkers/BoxChecker.h"
#include "tests/checkers/tests/BoxDoctor.h"
#include "tests/checkers/tests/FileBytes.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/linux_mp4/Media.h"

namespace lumacast::checkers {
namespace {

using Bytes = BoxDoctor::Bytes;
using D = BoxDoctor;

class BoxFragmentsTest : public ::testing::Test {
protected:
    void SetUp() override {
        const auto video = mp4::test::encodeVideo(mp4::test::steadyStamps(75, 30));
        const auto sound = mp4::test::encodeAudio(0, 2 * 48000 + 24000, [](std::int64_t) { return true; }, "sound");
        mp4::test::MemorySink sink;
        mp4::MovieBoxWriter writer(sink);
        ASSERT_EQ(mp4::test::writeMovie(writer, video, {&sound}), mp4::MovieError::none);
        ASSERT_EQ(writer.flushFragment(), mp4::MovieError::none);
        good_.assign(sink.file().begin(), sink.file().end());
    }

    BoxReport check(const Bytes& bytes) {
        writeBytes(path_, bytes);
        return checkBoxes(path_, BoxShape::Fragmented);
    }

    void expectEachNamed(const std::vector<Damage>& damages) {
        for (const Damage& damage : damages) {
            BoxDoctor doctor(good_);
            damage.doctor(doctor);
            ASSERT_NE(doctor.bytes(), good_) << damage.what;
            const BoxReport report = check(doctor.bytes());
            EXPECT_TRUE(isNamed(report.findings, damage))
                << damage.what << " gave:\n" << ::testing::PrintToString(report.findings);
        }
    }

    ScratchDirectory folder_;
    std::string path_ = folder_.path("movie.mp4");
    Bytes good_;
};

TEST_F(BoxFragmentsTest, AcceptsAGoodMovieAndCountsWhatItHas) {
    const BoxReport report = check(good_);
    EXPECT_EQ(report.findings, Findings{});
    EXPECT_EQ(report.fragments, 3U);
    EXPECT_EQ(report.cutOff, 0U);
    ASSERT_EQ(report.tracks.size(), 2U);
    EXPECT_EQ(report.tracks[0].samples, 75U);
    EXPECT_EQ(report.tracks[0].syncSamples, 3U);
    // How long the last picture lasts was not known yet.
    EXPECT_EQ(report.tracks[0].mediaDuration, 74 * 1'000'000U / 30 + 1);
    EXPECT_GT(report.tracks[1].samples, 110U);
    // Neither kind passes for the other.
    EXPECT_FALSE(checkBoxes(path_, BoxShape::Finished).findings.empty());
}

TEST_F(BoxFragmentsTest, AcceptsAMovieThatIsCutOffBehindAWholeFragment) {
    const std::size_t second = BoxDoctor(good_).at("moof:2");
    for (const std::size_t more : {0U, 5U}) {
        const BoxReport report = check(Bytes(good_.begin(), good_.begin() + static_cast<std::ptrdiff_t>(second + more)));
        EXPECT_EQ(report.findings, Findings{});
        EXPECT_EQ(report.fragments, 1U);
        EXPECT_EQ(report.cutOff, more);
    }
    // What is not to be read yet may be cut off anywhere.
    BoxDoctor doctor(good_);
    doctor.rename("moof:2", "free");
    for (const std::size_t keep : {second + 20, BoxDoctor(good_).at("mdat:2") + 100}) {
        const BoxReport report = check(
            Bytes(doctor.bytes().begin(), doctor.bytes().begin() + static_cast<std::ptrdiff_t>(keep)));
        EXPECT_EQ(report.findings, Findings{});
        EXPECT_GT(report.cutOff, 0U);
    }
}

TEST_F(BoxFragmentsTest, NamesWhatIsWrongWithTheFile) {
    const auto cutBefore = [](D& d, const char* path, int more) {
        d.bytes().resize(d.at(path) + static_cast<std::size_t>(more));
    };
    expectEachNamed({
        {"a fragment cut off", "doesn't fit into the file", "14496-12, 4.2", [&](D& d) { cutBefore(d, "moof:2", 20); }},
        {"media cut off", "the media of fragment 2 don't follow it", "", [&](D& d) { cutBefore(d, "mdat:2", 20); }},
        {"samples cut off", "isn't within the media data", "14496-12, 8.1.1", [&](D& d) { cutBefore(d, "mdat:2", 20); }},
        {"the header cut off", "0 moov boxes", "14496-12, 8.2.1", [&](D& d) { cutBefore(d, "moov", 20); }},
        {"no brand", "no brand iso5 or later", "14496-12, 8.8.7",
         [](D& d) {
             for (std::size_t place = d.at("ftyp") + 8; place < d.number(0); place += 4)
                 if (d.number(place) == 0x69736F35) d.setNumber(place, 0x6D703432);
         }},
        {"the header late", "a fragment stands before moov", "",
         [](D& d) {
             const auto from = d.bytes().begin() + static_cast<std::ptrdiff_t>(d.at("moov"));
             std::rotate(from, from + d.number(d.at("moov")), d.bytes().end());
         }},
    });
}

TEST_F(BoxFragmentsTest, NamesWhatIsWrongWithTheMovieHeader) {
    const std::string picture = "moov/trak:1", tables = picture + "/mdia/minf/stbl/";
    expectEachNamed({
        {"no extends", "0 mvex boxes", "14496-12, 8.8.1", [](D& d) { d.rename("moov/mvex", "free"); }},
        {"a track without defaults", "there are 0 trex for track 2", "14496-12, 8.8.3",
         [](D& d) { d.rename("moov/mvex/trex:2", "free"); }},
        {"defaults twice", "there are 2 trex for track 1", "14496-12, 8.8.3",
         [](D& d) { d.set("moov/mvex/trex:2", 12, 1); }},
        {"defaults of nobody", "trex names a track that isn't there", "14496-12, 8.8.3",
         [](D& d) { d.set("moov/mvex/trex:2", 12, 7); }},
        {"another entry", "trex names a sample entry that isn't there", "14496-12, 8.8.3",
         [](D& d) { d.set("moov/mvex/trex", 16, 2); }},
        {"a duration", "mdhd has a duration", "14496-12, 8.4.2", [&](D& d) { d.set(picture + "/mdia/mdhd", 24, 90000); }},
        {"a duration of the track", "tkhd says 40", "14496-12, 8.3.2", [&](D& d) { d.set(picture + "/tkhd", 28, 40); }},
        {"a duration of the movie", "mvhd says it lasts 40", "14496-12, 8.2.2", [](D& d) { d.set("moov/mvhd", 24, 40); }},
        {"samples in the tables", "stsz has entries", "14496-12, 8.8.1", [&](D& d) { d.set(tables + "stsz", 16, 1); }},
        {"times in the tables", "stts has another size", "14496-12, 8.6.1.2", [&](D& d) { d.set(tables + "stts", 12, 1),
              d.set(tables + "stts", 0, d.number(d.at(tables + "stts")) + 16); }},
        {"no tables", "0 stsc boxes", "14496-12, 8.7.4", [&](D& d) { d.rename(tables + "stsc", "free"); }},
    });
}

TEST_F(BoxFragmentsTest, NamesWhatIsWrongWithAFragment) {
    const char *header = "14496-12, 8.8.7", *run = "14496-12, 8.8.8", *time = "14496-12, 8.8.12";
    const std::string traf = "moof:2/traf:1/", sound = "moof:2/traf:2/";
    const auto trun = [](const D& d) { return d.at("moof:2/traf:1/trun"); };
    // Of a run's first entry: the duration, the size and the flags. The second fragment begins with sample 30; the second
    // key frame is sample 31.
    constexpr std::size_t kDuration = 20, kSize = 24, kFlags = 28, kEntry = 12;
    expectEachNamed({
        {"no number", "0 mfhd boxes", "14496-12, 8.8.5", [](D& d) { d.rename("moof:2/mfhd", "free"); }},
        {"the same number", "fragment 2 has the number 1 after 1", "14496-12, 8.8.5",
         [](D& d) { d.set("moof:2/mfhd", 12, 1); }},
        {"no header", "0 tfhd boxes", header, [&](D& d) { d.rename(traf + "tfhd", "free"); }},
        {"another track", "fragment 2 names track 9", header, [&](D& d) { d.set(traf + "tfhd", 12, 9); }},
        {"another base", "doesn't count its data offsets from itself", header,
         [&](D& d) { d.add(traf + "tfhd", 8, ~0x20000U + 1); }},
        {"a field too few", "tfhd has another size", header, [&](D& d) { d.add(traf + "tfhd", 8, 2); }},
        {"no time", "0 tfdt boxes", time, [&](D& d) { d.rename(traf + "tfdt", "free"); }},
        {"earlier", "decodes track 1 from 1000 on, the one before ended at 93", time,
         [&](D& d) { d.set(traf + "tfdt", 16, 1000); }},
        {"sound with a hole", "decodes track 2 from", "", [&](D& d) { d.add(sound + "tfdt", 16, 1); }},
        {"sound earlier", "decodes track 2 from", time, [&](D& d) { d.add(sound + "tfdt", 16, ~0U); }},
        {"no run", "has a track without samples", "14496-12, 8.8.6", [&](D& d) { d.rename(traf + "trun", "free"); }},
        {"a sample more", "trun has another size", run, [&](D& d) { d.add(traf + "trun", 12, 1); }},
        {"no sample", "has a run without samples", run, [&](D& d) { d.set(traf + "trun", 12, 0); }},
        {"data elsewhere", "sample 30 is not filled by its NAL units", "14496-15, 5.3.2",
         [&](D& d) { d.add(traf + "trun", 16, 1); }},
        {"data outside", "isn't within the media data", "14496-12, 8.1.1", [&](D& d) { d.add(traf + "trun", 16, 1 << 24); }},
        {"data in the other's", "two samples overlap", "",
         [&](D& d) { d.setNumber(d.at(sound + "trun") + 16, d.number(trun(d) + 16)); }},
        {"a size", "has samples of", "", [&](D& d) { d.add(traf + "trun", kSize, 1); }},
        {"an empty sample", "sample 30 of track 1 is empty", run, [&](D& d) { d.set(traf + "trun", kSize, 0); }},
        {"a picture that lasts longer", "decodes track 1 from", time,
         [&](D& d) { d.add("moof:1/traf:1/trun", kDuration, 1'000'000); }},
        {"a picture that doesn't last", "sample 30 of track 1 has no duration", run,
         [&](D& d) { d.set(traf + "trun", kDuration, 0); }},
        {"no sync sample", "sample 31 is a sync sample and is not called one", "14496-12, 8.6.2",
         [&](D& d) { d.set(traf + "trun", kFlags + kEntry, 0x01010000); }},
        {"sync and dependent", "is a sync sample that depends on others", "14496-12, 8.8.3",
         [&](D& d) { d.set(traf + "trun", kFlags + kEntry, 0x01000000); }},
        {"does not begin with one", "the first sample of track 1 isn't a sync sample", "",
         [&](D& d) { d.set("moof:1/traf:1/trun", kFlags, 0x01010000); }},
    });
}

TEST_F(BoxFragmentsTest, AnyByteOfTheHeadersOverwrittenEndsTheWalkInOrder) {
    const std::size_t fragment = BoxDoctor(good_).at("moof:1");
    for (std::size_t place = 0; place < fragment + BoxDoctor(good_).number(fragment); place += 3) {
        Bytes bytes = good_;
        bytes[place] = static_cast<char>(0xFF);
        (void)check(bytes);
    }
}

}  // namespace
}  // namespace lumacast::checkers
