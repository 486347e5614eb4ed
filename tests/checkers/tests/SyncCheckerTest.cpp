// Beeps against marked pictures, on lists of times and on whole movies.

#include "tests/checkers/SyncChecker.h"

#include <gtest/gtest.h>

#include <cmath>
#include <nlohmann/json.hpp>

#include "examples/scene/Mark.h"
#include "tests/checkers/Luma.h"
#include "tests/checkers/tests/Child.h"
#include "tests/checkers/tests/MovieMaker.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::checkers {
namespace {

using namespace std::chrono_literals;
using std::chrono::nanoseconds;

/// Ten seconds at 30 a second, from number 100 on; three pictures from each multiple of 30 on are marked.
std::vector<NumberedPicture> markedPictures() {
    std::vector<NumberedPicture> pictures;
    for (std::uint32_t n = 100; n < 400; ++n)
        pictures.push_back({nanoseconds((n - 100) * 1'000'000'000LL / 30), n, n % 30 < 3});
    return pictures;
}

TEST(SyncChecker, TakesTheFirstPictureOfEachRunOfMarkedOnes) {
    const auto pictures = markedPictures();
    const auto times = markTimes(pictures);
    ASSERT_EQ(times.size(), 10U);
    EXPECT_EQ(times.front(), pictures[20].time);
    EXPECT_EQ(times.back(), pictures[290].time);
    std::vector<NumberedPicture> begun{{0ns, 90, true}, {33ms, 91, true}, {66ms, 92, false}};
    EXPECT_TRUE(markTimes(begun).empty()) << "it appeared before the movie began";
}

class Beeps : public ::testing::Test {
protected:
    SyncReport check(const SyncExpectation& expectation = {}) {
        return checkBeepsAtMarks(pictures_, onsets_, expectation);
    }
    std::vector<NumberedPicture> pictures_ = markedPictures();
    std::vector<nanoseconds> onsets_ = markTimes(pictures_);
};

TEST_F(Beeps, AtTheirMarksAreAccepted) {
    onsets_[3] += 19ms;
    onsets_[5] -= 12ms;
    const SyncReport report = check();
    EXPECT_TRUE(report.findings.empty()) << report.findings.front();
    EXPECT_EQ(report.pairs.size(), 10U);
    EXPECT_EQ(report.worst, 19ms);
    EXPECT_EQ(report.drift, 0ns);
}

TEST_F(Beeps, ThatAreLateOrEarlyAreFound) {
    onsets_[3] += 40ms;
    EXPECT_EQ(check().findings, (Findings{"the beep for the mark at 3666.7 ms comes 40.0 ms late"}));
    onsets_[3] -= 80ms;
    EXPECT_EQ(check().findings, (Findings{"the beep for the mark at 3666.7 ms comes 40.0 ms early"}));
    EXPECT_TRUE(check({.tolerance = 41ms, .forbidden = {}}).findings.empty());
    EXPECT_EQ(check().worst, -40ms);
}

TEST_F(Beeps, ThatAreMissingOrTooManyAreFound) {
    onsets_.erase(onsets_.begin() + 4);
    EXPECT_EQ(check().findings, (Findings{"no beep for the mark at 4666.7 ms"}));
    onsets_ = markTimes(pictures_);
    onsets_.push_back(5s);
    EXPECT_EQ(check().findings.size(), 1U);
    onsets_.clear();
    EXPECT_EQ(check().findings.size(), 11U) << "one for each mark, and that there are no pairs";
}

TEST_F(Beeps, ThatDriftAwayShowIt) {
    for (std::size_t place = 0; place < onsets_.size(); ++place) onsets_[place] += 2ms * static_cast<int>(place);
    const SyncReport report = check();
    EXPECT_TRUE(report.findings.empty());
    ASSERT_TRUE(report.drift);
    EXPECT_EQ(*report.drift, 14ms);
}

TEST_F(Beeps, SeveredByAPauseNeedNoMarkAndOnlyThere) {
    // The pause began at number 210 and cut off the mark's pictures, and at the other end a beep's mark.
    std::erase_if(pictures_, [](const NumberedPicture& picture) { return *picture.number >= 210 && *picture.number < 245; });
    const nanoseconds gone = 35'000'000'000ns / 30;
    for (NumberedPicture& picture : pictures_)
        if (*picture.number >= 245) picture.time -= gone;
    for (nanoseconds& onset : onsets_)
        if (onset > pictures_[110].time) onset -= gone;
    EXPECT_FALSE(check().findings.empty());
    EXPECT_TRUE(check({.tolerance = 20ms, .forbidden = {{210, 244}}}).findings.empty());
}

TEST_F(Beeps, MayBeMissingWhereClipsMeetAndOnlyThere) {
    SyncExpectation joined;
    joined.cuts = {onsets_[2] + 100ms, onsets_[6] - 100ms};
    onsets_.erase(onsets_.begin() + 6);
    onsets_.erase(onsets_.begin() + 2);
    EXPECT_TRUE(check(joined).findings.empty());
    joined.cuts[1] += 300ms;
    EXPECT_EQ(check(joined).findings.size(), 1U);
}

TEST_F(Beeps, WithoutAnyMarkSayNothing) {
    for (NumberedPicture& picture : pictures_) picture.isMarked = false;
    onsets_.clear();
    EXPECT_EQ(check().findings, (Findings{"0 marks with a beep, at least 1 wanted"}));
    pictures_.clear();
    EXPECT_EQ(check().findings, (Findings{"there are no pictures"}));
}

TEST(Mark, IsReadFromEverySizeAndMotionAndFromNoOtherFrame) {
    for (const auto& [width, height] : {std::pair{160, 90}, {320, 180}, {641, 363}, {1280, 720}, {90, 160}}) {
        for (std::uint32_t number = 1; number < 400; number += 13) {
            const LumaPlane plain = sceneLuma(width, height, number);
            const LumaPlane marked = sceneLuma(width, height, number, scene::Mark::Border);
            EXPECT_FALSE(isMarked(plain.view())) << width << "x" << height << " " << number;
            EXPECT_TRUE(isMarked(marked.view())) << width << "x" << height << " " << number;
            EXPECT_EQ(frameNumberIn(marked.view()), frameNumberIn(plain.view()));
            EXPECT_TRUE(isMarked(turned(marked.view(), 1).view(), 1));
            EXPECT_FALSE(isMarked(turned(marked.view(), 1).view(), 0));
        }
    }
}

/// A movie of six seconds with a mark and a beep each second, encoded at half size and a low bit rate.
class SyncMovie : public ::testing::Test {
protected:
    SyncMovie() {
        plan_.pictures = steadyPictures(15, 180, 30);
        for (PlannedPicture& picture : plan_.pictures) picture.isMarked = picture.number % 30 < 3;
        plan_.soundSeconds = 6;
        plan_.sound = [this](double seconds) {
            const double place = std::fmod(seconds - 0.5 - lateness_ + 10, 1.0);
            return place < 0.05 ? static_cast<float>(0.4 * std::cos(2 * M_PI * 1000 * place)) : 0.0F;
        };
    }
    // Runs the tool on the plan's movie, as scripts do; its exit status.
    int check(std::vector<std::string> options = {}) {
        const std::string path = folder_.path("movie.mp4");
        EXPECT_EQ(makeMovie(plan_, path), "");
        options.insert(options.begin(), {LC_CHECK_MOVIE, path, "--beeps-at-marked-frames", "1000"});
        Child tool(options, {}, folder_.path("errors"));
        report_ = nlohmann::json::parse(tool.readAll(), nullptr, false);
        return tool.wait();
    }
    ScratchDirectory folder_;
    MoviePlan plan_;
    double lateness_ = 0;
    nlohmann::json report_;
};

TEST_F(SyncMovie, WithBeepsAtItsMarksPasses) {
    EXPECT_EQ(check({"--min-sync-pairs", "6"}), 0) << report_["findings"];
    EXPECT_EQ(report_["sync"]["pairs"], 6);
    EXPECT_LT(std::abs(report_["sync"]["worst_ms"].get<double>()), 3);
    EXPECT_EQ(check({"--min-sync-pairs", "7"}), 1);
}

TEST_F(SyncMovie, WhoseSoundIsLateOrEarlyIsRejected) {
    lateness_ = 0.04;
    EXPECT_EQ(check({"--max-sync-ms", "20"}), 1);
    EXPECT_EQ(report_["findings"].size(), 6U) << report_["findings"];
    EXPECT_NEAR(report_["sync"]["worst_ms"].get<double>(), 40, 3);
    EXPECT_EQ(check({"--max-sync-ms", "45"}), 0);
    lateness_ = -0.04;
    EXPECT_EQ(check(), 1);
    EXPECT_NEAR(report_["sync"]["worst_ms"].get<double>(), -40, 3);
}

TEST_F(SyncMovie, WithoutItsSoundIsRejected) {
    plan_.soundSeconds = 0;
    EXPECT_EQ(check(), 1);
    EXPECT_EQ(check({"--no-numbers"}), 2);
}

}  // namespace
}  // namespace lumacast::checkers
