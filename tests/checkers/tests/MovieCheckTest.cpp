// Whole movies, encoded at a low bit rate and half size, judged by the frame numbers in them.

#include <gtest/gtest.h>

#include "tests/checkers/BoxChecker.h"
#include "tests/checkers/FrameNumberChecker.h"
#include "tests/checkers/MovieReader.h"
#include "tests/checkers/tests/FileBytes.h"
#include "tests/checkers/tests/MovieMaker.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::checkers {
namespace {

using namespace std::chrono_literals;
using Kind = FrameFinding::Kind;

constexpr int kRate = 30;
constexpr int kCount = 60;
constexpr std::uint32_t kFirst = 0x00FFF0;  // the upper row changes on the way

class MovieCheck : public ::testing::Test {
protected:
    void SetUp() override {
        plan_.pictures = steadyPictures(kFirst, kCount, kRate);
        FramesLog log;
        // The host's clock began long before the movie's; sending took up to 2 ms.
        for (const PlannedPicture& picture : plan_.pictures)
            log[picture.number] = {1000s + picture.time, 1000s + picture.time + 2ms};
        expectation_.drawn = log;
        expectation_.withoutGaps = true;
        expectation_.largestHole = 40ms;
        for (const PlannedPicture& picture : plan_.pictures) expectation_.expected.insert(picture.number);
    }

    FrameReport judge() {
        const std::string path = folder_.path("movie.mp4");
        EXPECT_EQ(makeMovie(plan_, path), "");
        MovieReader reader(path);
        EXPECT_EQ(reader.error(), "");
        std::vector<NumberedPicture> pictures;
        EXPECT_TRUE(readFrameNumbers(reader, pictures)) << reader.error();
        return checkFrameNumbers(pictures, expectation_);
    }

    // Exactly these kinds of findings.
    static void expectOnly(const FrameReport& report, const std::set<Kind>& kinds) {
        std::set<Kind> found;
        for (const FrameFinding& finding : report.findings) found.insert(finding.kind);
        std::string texts;
        for (const FrameFinding& finding : report.findings) texts += finding.text + "\n";
        EXPECT_EQ(found, kinds) << texts;
    }

    ScratchDirectory folder_;
    MoviePlan plan_;
    FrameExpectation expectation_;
};

TEST_F(MovieCheck, AcceptsAGoodMovieAtHalfSizeAndALowBitRate) {
    const FrameReport report = judge();
    expectOnly(report, {});
    EXPECT_EQ(report.pictures, static_cast<std::size_t>(kCount));
    EXPECT_EQ(report.unreadable, 0U);
    EXPECT_EQ(report.first, kFirst);
    EXPECT_EQ(report.last, kFirst + kCount - 1);
    EXPECT_TRUE(report.orderOk);
    EXPECT_LT(report.largestHole, 34ms);
    EXPECT_LT(*report.largestLateness, 3ms);
}

TEST_F(MovieCheck, AcceptsGoodMoviesOfOtherSizesAndWithReorderedPictures) {
    for (const auto& [width, height, rate, half] : {std::tuple{160, 90, 60'000, true},
                                                    {390, 844, 250'000, true},
                                                    {640, 360, 200'000, false},
                                                    {1280, 720, 400'000, true}}) {
        plan_.width = width;
        plan_.height = height;
        plan_.bitRate = rate;
        plan_.halfSize = half;
        plan_.reordered = width == 640;
        SCOPED_TRACE(width);
        expectOnly(judge(), {});
    }
}

TEST_F(MovieCheck, RejectsADroppedFrame) {
    plan_.pictures.erase(plan_.pictures.begin() + 20);
    const FrameReport report = judge();
    expectOnly(report, {Kind::Missing, Kind::Hole});
    EXPECT_EQ(report.missing, std::vector<std::uint32_t>{kFirst + 20});
    EXPECT_NEAR(static_cast<double>(report.largestHole.count()), 66.7e6, 0.1e6);
}

TEST_F(MovieCheck, AllowsForSingleFramesThatAreMissingButNotForTwoInARow) {
    expectation_.largestHole.reset();
    expectation_.allowedMissing = 2;
    plan_.pictures.erase(plan_.pictures.begin() + 20);
    plan_.pictures.erase(plan_.pictures.begin() + 30);
    expectOnly(judge(), {});
    EXPECT_EQ(judge().missing.size(), 2U);
    expectation_.allowedMissing = 1;
    expectOnly(judge(), {Kind::Missing});
    expectation_.allowedMissing = 5;
    plan_.pictures.erase(plan_.pictures.begin() + 30);
    expectOnly(judge(), {Kind::Missing, Kind::Missing});
}

TEST_F(MovieCheck, RejectsALostEndWhenTheWholeSetIsExpected) {
    plan_.pictures.pop_back();
    expectOnly(judge(), {Kind::Missing});
}

TEST_F(MovieCheck, RejectsADoubledFrameBeyondTheAllowance) {
    plan_.pictures[20].number = plan_.pictures[19].number;
    expectation_.expected.erase(kFirst + 20);
    expectation_.drawn->erase(kFirst + 20);
    expectOnly(judge(), {Kind::Doubled});
    expectation_.allowedRepeats = 1;
    const FrameReport report = judge();
    expectOnly(report, {});
    EXPECT_EQ(report.repeats, 1U);
}

TEST_F(MovieCheck, RejectsTwoFramesSwapped) {
    std::swap(plan_.pictures[20].number, plan_.pictures[21].number);
    const FrameReport report = judge();
    // Each of the two is 33 ms away from its place as well.
    expectOnly(report, {Kind::OutOfOrder, Kind::Late});
    EXPECT_FALSE(report.orderOk);
}

TEST_F(MovieCheck, RejectsOnePictureFortyMillisecondsLate) {
    plan_.pictures = steadyPictures(kFirst, kCount, 15);
    for (const PlannedPicture& picture : plan_.pictures)
        (*expectation_.drawn)[picture.number] = {1000s + picture.time, 1000s + picture.time + 2ms};
    expectation_.largestHole.reset();
    expectOnly(judge(), {});
    plan_.pictures[30].time += 40ms;
    const FrameReport report = judge();
    expectOnly(report, {Kind::Late});
    EXPECT_EQ(report.findings.size(), 1U);
    EXPECT_NEAR(static_cast<double>(report.largestLateness->count()), 39e6, 2e6);
}

TEST_F(MovieCheck, RejectsTheSecondHalfFortyMillisecondsLate) {
    for (std::size_t place = 35; place < plan_.pictures.size(); ++place) plan_.pictures[place].time += 40ms;
    expectation_.largestHole.reset();
    expectOnly(judge(), {Kind::Late});
}

TEST_F(MovieCheck, AcceptsAPauseCutOutOfTheMovie) {
    // Numbers 20 to 39 were drawn while paused; what follows them moves up.
    plan_.pictures.erase(plan_.pictures.begin() + 20, plan_.pictures.begin() + 40);
    for (std::size_t place = 20; place < plan_.pictures.size(); ++place) plan_.pictures[place].time -= 20 * 33333333ns;
    expectation_.forbidden = {{kFirst + 20, kFirst + 39}};
    for (std::uint32_t number = kFirst + 20; number < kFirst + 40; ++number) expectation_.expected.erase(number);
    expectOnly(judge(), {});
    // Without knowing of the pause the same movie is wrong.
    expectation_.forbidden.clear();
    expectOnly(judge(), {Kind::Missing, Kind::Late});
}

TEST_F(MovieCheck, RejectsAFrameDrawnDuringAPause) {
    expectation_.forbidden = {{kFirst + 25, kFirst + 25}};
    expectation_.expected.erase(kFirst + 25);
    const FrameReport report = judge();
    expectOnly(report, {Kind::Forbidden});
    EXPECT_EQ(report.forbidden, std::vector<std::uint32_t>{kFirst + 25});
}

TEST_F(MovieCheck, RejectsANumberThatWasNeverDrawn) {
    expectation_.drawn->erase(kFirst + 7);
    expectOnly(judge(), {Kind::Unlogged});
}

TEST_F(MovieCheck, RejectsPicturesWithoutAReadableNumberBeyondTheAllowance) {
    std::vector<NumberedPicture> pictures{{0ms, 1}, {20ms, std::nullopt}, {40ms, 2}};
    FrameExpectation expectation;
    expectOnly(checkFrameNumbers(pictures, expectation), {Kind::Unreadable});
    expectation.allowedUnreadable = 1;
    expectOnly(checkFrameNumbers(pictures, expectation), {});
}

TEST_F(MovieCheck, RejectsAMovieWithoutPicturesAndTimesThatStandStill) {
    expectOnly(checkFrameNumbers({}, {}), {Kind::NoPictures});
    expectOnly(checkFrameNumbers({{0ms, 1}, {0ms, 2}}, {}), {Kind::TimesNotRising});
}

TEST_F(MovieCheck, ReportsWhatAMovieIs) {
    plan_.soundSeconds = 2;
    plan_.sound = [](double) { return 0.0F; };
    const std::string path = folder_.path("movie.mp4");
    ASSERT_EQ(makeMovie(plan_, path), "");
    const MovieReader reader(path);
    ASSERT_EQ(reader.videoTracks().size(), 1U);
    EXPECT_EQ(reader.videoTracks()[0].codec, "h264");
    EXPECT_EQ(reader.videoTracks()[0].profile, "Constrained Baseline");
    EXPECT_EQ(reader.videoTracks()[0].width, 160);
    EXPECT_EQ(reader.videoTracks()[0].height, 90);
    EXPECT_EQ(reader.videoTracks()[0].rotation, 0);
    ASSERT_EQ(reader.audioTracks().size(), 1U);
    EXPECT_EQ(reader.audioTracks()[0].codec, "aac");
    EXPECT_EQ(reader.audioTracks()[0].sampleRate, 48000);
    EXPECT_EQ(reader.audioTracks()[0].channels, 2);
    EXPECT_NEAR(std::chrono::duration<double>(reader.duration()).count(), 2.0, 0.04);
}

TEST_F(MovieCheck, SaysThatATruncatedOrMissingFileCantBeRead) {
    const std::string path = folder_.path("movie.mp4");
    ASSERT_EQ(makeMovie(plan_, path), "");
    auto bytes = bytesOf(path);
    bytes.resize(bytes.size() / 2);
    writeBytes(path, bytes);
    EXPECT_NE(MovieReader(path).error(), "");
    EXPECT_NE(MovieReader(folder_.path("none.mp4")).error(), "");
}

TEST_F(MovieCheck, SaysThatDamagedMediaCantBeDecoded) {
    const std::string path = folder_.path("movie.mp4");
    ASSERT_EQ(makeMovie(plan_, path), "");
    auto bytes = bytesOf(path);
    // Junk in the middle of the media; the index stays whole.
    for (std::size_t place = bytes.size() / 2; place < bytes.size() / 2 + 400; ++place)
        bytes[place] = static_cast<char>(place * 37);
    writeBytes(path, bytes);
    const Findings findings = checkBoxes(path).findings;
    ASSERT_EQ(findings.size(), 1U) << ::testing::PrintToString(findings);
    EXPECT_NE(findings[0].find("is not filled by its NAL units"), std::string::npos) << findings[0];
    MovieReader reader(path);
    std::vector<NumberedPicture> pictures;
    EXPECT_FALSE(readFrameNumbers(reader, pictures));
    EXPECT_NE(reader.error(), "");
}

}  // namespace
}  // namespace lumacast::checkers
