// The tool as scripts call it.

#include <gtest/gtest.h>

#include <cmath>
#include <nlohmann/json.hpp>

#include "tests/checkers/tests/Child.h"
#include "tests/checkers/tests/MovieMaker.h"
#include "tests/checkers/tests/FileBytes.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::checkers {
namespace {

using nlohmann::json;

class CheckMovie : public ::testing::Test {
protected:
    void SetUp() override {
        plan_.pictures = steadyPictures(100, 30, 30);
        plan_.soundSeconds = 1;
        plan_.sound = [](double seconds) { return static_cast<float>(0.25 * std::sin(2 * M_PI * 440 * seconds)); };
        std::ofstream log(log_);
        for (const PlannedPicture& picture : plan_.pictures)
            log << picture.number << " " << picture.time.count() + 5'000'000'000 << "\n";
    }

    // Runs the tool on the plan's movie; its exit status.
    int run(const std::vector<std::string>& options) {
        if (!made_) {
            EXPECT_EQ(makeMovie(plan_, movie_), "");
            made_ = true;
        }
        std::vector<std::string> command{LC_CHECK_MOVIE, movie_};
        command.insert(command.end(), options.begin(), options.end());
        Child tool(command, {}, folder_.path("errors"));
        const std::string output = tool.readAll();
        report_ = json::parse(output, nullptr, false);
        const int status = tool.wait();
        const auto bytes = bytesOf(folder_.path("errors"));
        errors_.assign(bytes.begin(), bytes.end());
        return status;
    }

    ScratchDirectory folder_;
    std::string movie_ = folder_.path("movie.mp4");
    std::string log_ = folder_.path("frames.txt");
    MoviePlan plan_;
    bool made_ = false;
    json report_;
    std::string errors_;
};

TEST_F(CheckMovie, PassesAGoodMovieAndReportsIt) {
    const std::string sheet = folder_.path("sheet.png");
    EXPECT_EQ(run({"--frames-log", log_, "--expect-all", "--expect", "100-129", "--max-hole-ms", "34", "--tone", "440",
                   "--no-tone", "880", "--video-tracks", "1", "--audio-tracks", "1", "--min-seconds", "0.9",
                   "--max-seconds", "1.1", "--contact-sheet", sheet}),
              0)
        << errors_;
    EXPECT_EQ(errors_, "");
    EXPECT_EQ(report_["ok"], true);
    EXPECT_EQ(report_["video"][0]["codec"], "h264");
    EXPECT_EQ(report_["video"][0]["width"], 160);
    EXPECT_EQ(report_["audio"][0]["codec"], "aac");
    EXPECT_EQ(report_["frames"]["first"], 100);
    EXPECT_EQ(report_["frames"]["last"], 129);
    EXPECT_EQ(report_["frames"]["count"], 30);
    EXPECT_EQ(report_["frames"]["order_ok"], true);
    EXPECT_EQ(report_["frames"]["missing"], json::array());
    EXPECT_NEAR(report_["frames"]["largest_hole_ms"].get<double>(), 33.3, 0.1);
    EXPECT_EQ(report_["boxes"]["tracks"].size(), 2U);
    const auto png = bytesOf(sheet);
    ASSERT_GT(png.size(), 1000U);
    EXPECT_EQ(std::string(png.begin() + 1, png.begin() + 4), "PNG");
}

TEST_F(CheckMovie, FailsWithClearTextWhenAFrameIsMissing) {
    plan_.pictures.erase(plan_.pictures.begin() + 10);
    EXPECT_EQ(run({"--frames-log", log_, "--expect-all"}), 1);
    EXPECT_EQ(report_["frames"]["missing"], json::array({110}));
    EXPECT_NE(errors_.find("number 110 is missing"), std::string::npos) << errors_;
}

TEST_F(CheckMovie, FailsWhenAForbiddenFrameIsThereOrTheWrongToneIsHeard) {
    EXPECT_EQ(run({"--forbid", "105-106", "--forbid", "120-120"}), 1);
    EXPECT_EQ(report_["frames"]["forbidden"], json::array({105, 106, 120}));
    EXPECT_EQ(run({"--tone", "880"}), 1);
    EXPECT_EQ(run({"--no-tone", "440"}), 1);
    EXPECT_EQ(run({"--min-seconds", "2"}), 1);
    EXPECT_EQ(run({"--turned", "90"}), 1);
    EXPECT_EQ(run({"--turned", "90", "--allow-unreadable", "30"}), 0) << errors_;
    EXPECT_EQ(run({"--audio-track", "1", "--tone", "440"}), 1);
    EXPECT_EQ(run({"--video-tracks", "2"}), 1);
    EXPECT_EQ(run({"--audio-tracks", "0"}), 1);
}

TEST_F(CheckMovie, FailsOnAFileThatIsCutOffOrMissing) {
    ASSERT_EQ(run({}), 0);
    auto bytes = bytesOf(movie_);
    bytes.resize(bytes.size() - 100);
    writeBytes(movie_, bytes);
    EXPECT_EQ(run({}), 1);
    EXPECT_NE(errors_, "");
    movie_ = folder_.path("none.mp4");
    EXPECT_EQ(run({}), 1);
    EXPECT_EQ(report_["ok"], false);
}

TEST_F(CheckMovie, RefusesOptionsItDoesNotUnderstand) {
    EXPECT_EQ(run({"--forbid", "7"}), 2);
    EXPECT_EQ(run({"--forbid", "9-7"}), 2);
    EXPECT_EQ(run({"--bogus"}), 2);
    EXPECT_EQ(run({"--frames-log", folder_.path("none")}), 2);
}

}  // namespace
}  // namespace lumacast::checkers
