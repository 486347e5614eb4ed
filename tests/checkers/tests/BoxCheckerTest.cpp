#include "tests/checkers/BoxChecker.h"

#include <gtest/gtest.h>

#include "tests/checkers/tests/BoxDoctor.h"
#include "tests/checkers/tests/MovieMaker.h"
#include "tests/checkers/tests/FileBytes.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::checkers {
namespace {

using Bytes = BoxDoctor::Bytes;
using D = BoxDoctor;

const std::string kPicture = "moov/trak:1", kSound = "moov/trak:2";
const std::string kTables = "/mdia/minf/stbl";
const std::string kAvc = kPicture + kTables + "/stsd/avc1", kMp4a = kSound + kTables + "/stsd/mp4a";

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

TEST_F(BoxCheckerTest, NamesWhatIsWrongWithTheFileAndItsBoxes) {
    const char *boxes = "14496-12, 4.2", *type = "14496-12, 4.3", *movie = "14496-12, 8.2.1";
    expectEachNamed({
        {"truncated", "doesn't fit into the file", boxes, [](D& d) { d.bytes().resize(d.bytes().size() - 1); }},
        {"junk at the end", "doesn't fit into the file", boxes,
         [](D& d) { d.bytes().insert(d.bytes().end(), 5, 'x'); }},
        {"index too long", "doesn't fit into the file", boxes, [](D& d) { d.add("moov", 0, 1); }},
        {"media too long", "doesn't fit into the file", boxes, [](D& d) { d.add("mdat", 0, 1 << 30); }},
        {"media to the end", "doesn't fit into the file", boxes, [](D& d) { d.set("mdat", 0, 0); }},
        {"a box within too long", "doesn't fit where it is", boxes,
         [](D& d) { d.add(kPicture + "/mdia/minf/dinf", 0, 4); }},
        {"a box within too short", "doesn't fit where it is", boxes,
         [](D& d) { d.set(kPicture + kTables, 0, 7); }},
        {"a version nobody knows", "stts has version 1", boxes, [](D& d) { d.set(kPicture + kTables + "/stts", 8, 1, 1); }},
        {"no ftyp", "ftyp isn't first", type, [](D& d) { d.rename("ftyp", "free"); }},
        {"two ftyp", "several ftyp", type, [](D& d) { d.append("ftyp", 8); }},
        {"a brand of its own", "the major brand nobd is none", type, [](D& d) { d.set("ftyp", 8, 0x6E6F6264); }},
        {"no index", "0 moov boxes", movie, [](D& d) { d.rename("moov", "free"); }},
        {"two indexes", "2 moov boxes", movie, [](D& d) { d.append("moov", 0); }},
        {"a fragment", "a moof of a fragmented file", "14496-12, 8.8.4", [](D& d) { d.append("moof", 16); }},
        {"a fragment index", "a mfra of a fragmented file", "14496-12, 8.8.4", [](D& d) { d.append("mfra", 16); }},
        {"fragments announced", "an mvex box", "14496-12, 8.8.1", [](D& d) { d.rename("moov/udta", "mvex"); }},
        {"no tracks", "there are no tracks", "14496-12, 8.3.1",
         [](D& d) {
             d.rename(kSound, "free");
             d.rename(kPicture, "free");
         }},
    });
}

TEST_F(BoxCheckerTest, NamesWhatIsWrongWithTheHeaders) {
    const char *movie = "14496-12, 8.2.2", *track = "14496-12, 8.3.2", *media = "14496-12, 8.4.2",
               *handler = "14496-12, 8.4.3";
    expectEachNamed({
        {"movie duration", "mvhd says", movie, [](D& d) { d.add("moov/mvhd", 24, 1); }},
        {"movie time scale", "the time scale is 0", movie, [](D& d) { d.set("moov/mvhd", 20, 0); }},
        {"movie slower", "played at another speed", movie, [](D& d) { d.set("moov/mvhd", 28, 0x8000); }},
        {"next identifier", "identifier is in use", movie, [](D& d) { d.set("moov/mvhd", 104, 2); }},
        {"one identifier twice", "same identifier", track, [](D& d) { d.set(kSound + "/tkhd", 20, 1); }},
        {"no identifier", "the identifier is 0", track, [](D& d) { d.set(kSound + "/tkhd", 20, 0); }},
        {"disabled", "the track is disabled", track, [](D& d) { d.set(kSound + "/tkhd", 8, 0); }},
        {"no size", "no width or no height", track, [](D& d) { d.set(kPicture + "/tkhd", 84, 0); }},
        {"matrix", "the last column of the matrix", "14496-12, 6.2.2", [](D& d) { d.set(kPicture + "/tkhd", 80, 1); }},
        {"media time scale", "the time scale is 0", media, [](D& d) { d.set(kPicture + "/mdia/mdhd", 20, 0); }},
        {"media duration", "mdhd says", media, [](D& d) { d.add(kPicture + "/mdia/mdhd", 24, 1); }},
        {"language", "not three letters", media, [](D& d) { d.set(kPicture + "/mdia/mdhd", 28, 0, 2); }},
        {"handler", "a field that must be 0", handler, [](D& d) { d.set(kPicture + "/mdia/hdlr", 12, 1); }},
        {"handler's name", "doesn't end with 0", handler,
         [](D& d) {
             const std::size_t at = d.at(kPicture + "/mdia/hdlr");
             d.setNumber(at + d.number(at) - 1, 'x', 1);
         }},
        {"no media header", "0 vmhd boxes", "14496-12, 12.1.2", [](D& d) { d.rename(kPicture + "/mdia/minf/vmhd", "free"); }},
        {"its flags", "the flags 1", "14496-12, 12.1.2", [](D& d) { d.set(kPicture + "/mdia/minf/vmhd", 8, 0); }},
        {"no sound header", "0 smhd boxes", "14496-12, 12.2.2", [](D& d) { d.rename(kSound + "/mdia/minf/smhd", "free"); }},
        {"elsewhere", "the media are not in this file", "14496-12, 8.7.2",
         [](D& d) { d.set(kPicture + "/mdia/minf/dinf/dref/url ", 8, 0); }},
        {"references", "another number of references", "14496-12, 8.7.2",
         [](D& d) { d.add(kPicture + "/mdia/minf/dinf/dref", 12, 1); }},
    });
}

TEST_F(BoxCheckerTest, NamesWhatIsWrongWithTheEditsAndDurations) {
    const char *edits = "14496-12, 8.6.6", *track = "14496-12, 8.3.2";
    const auto list = [](const std::string& of) { return of + "/edts/elst"; };
    expectEachNamed({
        {"media time scale", "an edit reaches beyond", edits, [](D& d) { d.add(kSound + "/mdia/mdhd", 20, 10'000); }},
        {"edit too long", "an edit reaches beyond", edits, [&](D& d) { d.add(list(kPicture), 16, 40); }},
        {"edit begins late", "an edit reaches beyond", edits, [&](D& d) { d.add(list(kPicture), 20, 9000); }},
        {"edit before the media", "begins before the media", edits, [&](D& d) { d.set(list(kPicture), 20, 0x80000000); }},
        {"edit slows down", "changes the speed", edits, [&](D& d) { d.set(list(kPicture), 24, 0x8000); }},
        {"edit of nothing", "presents nothing", edits, [&](D& d) { d.set(list(kPicture), 16, 0); }},
        {"empty edit at the end", "the last edit is empty", edits, [&](D& d) { d.set(list(kPicture), 20, ~0U); }},
        {"no edit", "the edit list is empty", edits,
         [&](D& d) {
             // The only entry becomes a box of its own.
             d.set(list(kPicture), 0, 16);
             d.set(list(kPicture), 12, 0);
             const std::size_t rest = d.at(list(kPicture)) + 16;
             d.setNumber(rest, 12);
             d.setNumber(rest + 4, 0x66726565);
         }},
        {"edits of another count", "elst has another size", edits, [&](D& d) { d.add(list(kPicture), 12, 1); }},
        {"track duration", "the edit list lasts 1500, tkhd says 1501", track, [](D& d) { d.add(kPicture + "/tkhd", 28, 1); }},
        {"no edits and another duration", "the media lasts 1500, tkhd says 1540", track,
         [](D& d) {
             d.rename(kPicture + "/edts", "free");
             d.add(kPicture + "/tkhd", 28, 40);
         }},
        {"priming is heard", "presented with its priming", "", [&](D& d) { d.set(list(kSound), 20, 0); }},
        {"priming is heard, no edits", "presented with its priming", "", [](D& d) { d.rename(kSound + "/edts", "free"); }},
    });
}

TEST_F(BoxCheckerTest, NamesWhatIsWrongWithTheSampleTables) {
    const char *times = "14496-12, 8.6.1.2", *sync = "14496-12, 8.6.2", *sizes = "14496-12, 8.7.3",
               *chunks = "14496-12, 8.7.4", *offsets = "14496-12, 8.7.5";
    const auto table = [](const char* type) { return kPicture + kTables + "/" + type; };
    expectEachNamed({
        {"no sample sizes", "0 stsz boxes", sizes, [&](D& d) { d.rename(table("stsz"), "free"); }},
        {"sizes of another count", "stsz has another size", sizes, [&](D& d) { d.add(table("stsz"), 16, 1); }},
        {"an empty sample", "sample 1 is empty", sizes, [&](D& d) { d.set(table("stsz"), 20, 0); }},
        {"more than fits", "more samples than the file can hold", sizes,
         [&](D& d) {
             d.set(table("stsz"), 12, 1000);
             d.set(table("stsz"), 16, 1'000'000);
         }},
        {"a time too many", "stts has times for 46", times, [&](D& d) { d.add(table("stts"), 16, 1); }},
        {"times longer", "mdhd says", "14496-12, 8.4.2", [&](D& d) { d.add(table("stts"), 20, 1); }},
        {"times of zero", "samples of no duration", times, [&](D& d) { d.set(table("stts"), 20, 0); }},
        {"times of no sample", "an entry for no sample", times, [&](D& d) { d.set(table("stts"), 16, 0); }},
        {"times of another count", "stts has another size", times, [&](D& d) { d.add(table("stts"), 12, 1); }},
        {"chunks hold more", "samples in its chunks", chunks, [&](D& d) { d.add(table("stsc"), 20, 1); }},
        {"an empty chunk", "stsc has an empty chunk", chunks, [&](D& d) { d.set(table("stsc"), 20, 0); }},
        {"chunks begin late", "out of order or not there", chunks, [&](D& d) { d.set(table("stsc"), 16, 2); }},
        {"another sample entry", "a sample entry that isn't there", chunks, [&](D& d) { d.add(table("stsc"), 24, 1); }},
        {"no chunk offsets", "no table of chunk offsets", offsets, [&](D& d) { d.rename(table("stco"), "free"); }},
        {"wide offsets", "co64 has another size", offsets, [&](D& d) { d.rename(table("stco"), "co64"); }},
        {"narrow and wide offsets", "several tables of chunk offsets", offsets, [&](D& d) { d.rename(table("stss"), "co64"); }},
        {"two tables of offsets", "2 stco boxes", offsets, [&](D& d) { d.rename(table("stss"), "stco"); }},
        {"a chunk outside", "isn't within the media data", offsets, [&](D& d) { d.add(table("stco"), 16, 1 << 24); }},
        {"a chunk before the media", "isn't within the media data", offsets, [&](D& d) { d.set(table("stco"), 16, 8); }},
        {"sync samples late", "first sample isn't a sync sample", "", [&](D& d) { d.set(table("stss"), 16, 2); }},
        {"sync samples not there", "stss names samples", sync, [&](D& d) { d.set(table("stss"), 20, 46); }},
        {"sync samples twice", "stss names samples", sync, [&](D& d) { d.set(table("stss"), 20, 1); }},
        {"sync samples of another count", "stss has another size", sync, [&](D& d) { d.add(table("stss"), 12, 1); }},
    });
}

TEST_F(BoxCheckerTest, NamesWhatIsWrongWithCompositionOffsets) {
    MoviePlan plan;
    plan.pictures = steadyPictures(1, 45, 30);
    plan.reordered = true;
    ASSERT_EQ(makeMovie(plan, path_), "");
    good_ = bytesOf(path_);
    const std::string table = kPicture + kTables + "/ctts";
    expectEachNamed({
        {"one too many", "ctts has another number of samples", "14496-12, 8.6.1.3", [&](D& d) { d.add(table, 16, 1); }},
        {"another count", "ctts has another size", "14496-12, 8.6.1.3", [&](D& d) { d.add(table, 12, 1); }},
    });
}

TEST_F(BoxCheckerTest, NamesWhatIsWrongWithTheSamples) {
    const auto table = [](const char* type) { return kPicture + kTables + "/" + type; };
    const auto sample = [&](const D& d) { return d.number(d.at(table("stco")) + 16); };  // the first picture's bytes
    const char* units = "14496-15, 5.3.2";
    expectEachNamed({
        {"a sample too large", "two samples overlap", "", [&](D& d) { d.add(table("stsz"), 20, 4096); }},
        {"a sample of another size", "sample 1 is not filled by its NAL units", units,
         [&](D& d) { d.add(table("stsz"), 20, ~0U); }},
        {"a sample elsewhere", "sample 1 is not filled by its NAL units", units, [&](D& d) { d.add(table("stco"), 16, 1); }},
        {"a unit of another length", "sample 1 is not filled by its NAL units", units,
         [&](D& d) { d.setNumber(sample(d), d.number(sample(d)) + 1); }},
        {"a unit that can't be", "sample 1 is not filled by its NAL units", units,
         [&](D& d) { d.setNumber(sample(d) + 4, 0x86, 1); }},
        {"a parameter set", "sample 1 has parameter sets", units, [&](D& d) { d.setNumber(sample(d) + 4, 0x67, 1); }},
        {"no picture", "sample 1 has no slice", units,
         [&](D& d) {
             for (std::size_t at = sample(d), end = at + d.number(d.at(table("stsz")) + 20); at < end;
                  at += 4 + d.number(at))
                 d.setNumber(at + 4, 6, 1);
         }},
        {"no sync sample", "sample 31 is a sync sample and is not called one", "14496-12, 8.6.2",
         [&](D& d) { d.set(table("stss"), 20, 45); }},
        {"a sync sample that is none", "sample 30 is called a sync sample and is none", "14496-12, 8.6.2",
         [&](D& d) { d.set(table("stss"), 20, 30); }},
        {"all are sync samples", "sample 2 is called a sync sample and is none", "14496-12, 8.6.2",
         [&](D& d) { d.rename(table("stss"), "free"); }},
    });
}

TEST_F(BoxCheckerTest, NamesWhatIsWrongWithThePicturesDescription) {
    const char *record = "14496-15, 5.3.3.1", *entries = "14496-12, 8.5.2";
    expectEachNamed({
        {"no decoder configuration", "0 avcC boxes", "14496-15, 5.4.2.1", [](D& d) { d.rename(kAvc + "/avcC", "free"); }},
        {"two sample entries", "exactly one sample entry", entries, [](D& d) { d.add(kPicture + kTables + "/stsd", 12, 1); }},
        {"no data reference", "a data reference that isn't there", entries, [](D& d) { d.set(kAvc, 14, 2, 2); }},
        {"another width", "avc1 says 161x90, its sequence parameter set 160x90", "14496-12, 12.1.3",
         [](D& d) { d.set(kAvc, 32, 161, 2); }},
        {"another height", "avc1 says 160x92, its sequence parameter set 160x90", "14496-12, 12.1.3",
         [](D& d) { d.set(kAvc, 34, 92, 2); }},
        {"another version", "configuration version 2", record, [](D& d) { d.set(kAvc + "/avcC", 8, 2, 1); }},
        {"another profile", "another profile, compatibility or level", record, [](D& d) { d.set(kAvc + "/avcC", 9, 77, 1); }},
        {"another level", "another profile, compatibility or level", record, [](D& d) { d.set(kAvc + "/avcC", 11, 62, 1); }},
        {"reserved bits", "reserved bits of avcC", record, [](D& d) { d.set(kAvc + "/avcC", 12, 3, 1); }},
        {"lengths of three bytes", "lengths of 3 bytes", record, [](D& d) { d.set(kAvc + "/avcC", 12, 0xFE, 1); }},
        {"lengths of two bytes", "is not filled by its NAL units", "14496-15, 5.3.2",
         [](D& d) { d.set(kAvc + "/avcC", 12, 0xFD, 1); }},
        {"no sequence parameter set", "avcC has no sequence parameter set", record,
         [](D& d) { d.set(kAvc + "/avcC", 13, 0xE0, 1); }},
        {"something else for it", "something else for a sequence parameter set", record,
         [](D& d) { d.set(kAvc + "/avcC", 16, 0x68, 1); }},
        {"an unreadable one", "no sequence parameter set of avcC can be read", "14496-10, 7.3.2.1.1",
         [](D& d) {
             const std::size_t set = d.at(kAvc + "/avcC") + 14;
             for (std::size_t place = 4; place < d.number(set, 2); ++place) d.setNumber(set + 2 + place, 0, 1);
         }},
        {"too many picture parameter sets", "another size than its record", record,
         [](D& d) {
             const std::size_t sets = d.at(kAvc + "/avcC") + 14;
             d.setNumber(sets + 2 + d.number(sets, 2), 2, 1);
         }},
    });
}

TEST_F(BoxCheckerTest, NamesWhatIsWrongWithTheSoundsDescription) {
    const char *entry = "14496-12, 12.2.3", *decoder = "14496-1, 7.2.6.6";
    const std::string esds = kMp4a + "/esds";
    // libav's descriptors have lengths of four bytes: the decoder's begins at 20, its specific information at 38.
    expectEachNamed({
        {"no configuration", "0 esds boxes", "14496-14, 5.6", [&](D& d) { d.rename(esds, "free"); }},
        {"mono", "mp4a says 1 channels, its AudioSpecificConfig 2", entry, [](D& d) { d.set(kMp4a, 24, 1, 2); }},
        {"another rate", "another sampling rate", entry, [](D& d) { d.set(kMp4a, 32, 44100, 2); }},
        {"another time scale", "the time scale is not the sampling rate", entry,
         [](D& d) { d.set(kSound + "/mdia/mdhd", 20, 44100); }},
        {"no stream", "is not one elementary stream descriptor", "14496-1, 7.2.6.5", [&](D& d) { d.set(esds, 12, 4, 1); }},
        {"of another length", "is not one elementary stream descriptor", "14496-1, 7.2.6.5",
         [&](D& d) { d.add(esds, 16, ~0U, 1); }},
        {"dependent", "depends on another", "14496-1, 7.2.6.5", [&](D& d) { d.set(esds, 19, 0x80, 1); }},
        {"no decoder", "no decoder configuration", decoder, [&](D& d) { d.set(esds, 20, 6, 1); }},
        {"another codec", "something else than MPEG-4 audio", decoder, [&](D& d) { d.set(esds, 25, 0x20, 1); }},
        {"a picture's stream", "something else than an audio stream", decoder, [&](D& d) { d.set(esds, 26, 0x11, 1); }},
        {"no specific information", "no decoder specific information", "14496-1, 7.2.6.7",
         [&](D& d) { d.set(esds, 38, 6, 1); }},
        {"another rate in it", "another sampling rate than its AudioSpecificConfig, 44100", entry,
         [&](D& d) { d.set(esds, 43, 0x1210, 2); }},
        {"another end", "sync layer configuration", "14496-1, 7.3.2.3",
         [&](D& d) {
             const std::size_t at = d.at(esds);
             d.setNumber(at + d.number(at) - 1, 1, 1);
         }},
    });
}

TEST_F(BoxCheckerTest, RejectsAFileThatIsNoMovie) {
    for (const BoxShape shape : {BoxShape::Finished, BoxShape::Fragmented}) {
        for (const Bytes& bytes : {Bytes{}, Bytes(5000, 'x')}) {
            writeBytes(path_, bytes);
            EXPECT_FALSE(checkBoxes(path_, shape).findings.empty());
        }
        EXPECT_FALSE(checkBoxes(folder_.path("none.mp4"), shape).findings.empty());
    }
}

TEST_F(BoxCheckerTest, AnyByteOfTheIndexOverwrittenEndsTheWalkInOrder) {
    // No verdict is expected, only that a damaged index is never read beyond its end (the sanitizers watch).
    for (std::size_t place = BoxDoctor(good_).at("moov"); place < good_.size(); place += 3) {
        Bytes bytes = good_;
        bytes[place] = static_cast<char>(0xFF);
        (void)check(bytes);
    }
}

}  // namespace
}  // namespace lumacast::checkers
