#include "tests/system/SavingWorld.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <filesystem>

#include "tests/checkers/LibAv.h"
#include "tests/system/RawClient.h"

namespace lumacast::test {

namespace fs = std::filesystem;

bool becomesGone(const std::string& path) {
    return waitUntil([&] { return !fs::exists(path); });
}

std::function<float(double seconds)> tone(double frequency) {
    return [frequency](double seconds) {
        return static_cast<float>(0.3 * std::sin(2 * 3.14159265358979 * frequency * seconds));
    };
}

SavingWorld::SavingWorld() {
    av_log_set_level(AV_LOG_QUIET);
    installThisProcess(*this);
    for (const char* name : {"home", "videos", "movies"}) fs::create_directory(path(name));
}

void SavingWorld::startDaemon(std::vector<std::string> variables) {
    variables.insert(variables.end(), {"HOME=" + path("home"), "XDG_VIDEOS_DIR=" + path("videos")});
    World::startDaemon(variables);
    recorder_ = std::make_unique<client::Recorder>(client::Events{}, path("run/lumacast"));
}

std::int64_t SavingWorld::save(const std::string& movie) {
    const auto error = recorder_->saveAndWait(URL::file(movie), kPatience);
    return error ? error->code() : 0;
}

std::string SavingWorld::makeMovie(const std::string& name, const std::vector<double>& tones) {
    checkers::MoviePlan plan;
    plan.pictures = checkers::steadyPictures(kFirst, kFrames, 30);
    for (const double frequency : tones) {
        plan.soundSeconds = kFrames / 30.0;
        if (!plan.sound) plan.sound = tone(frequency);
        else plan.moreSounds.push_back(tone(frequency));
    }
    std::string movie = path("movies/" + name);
    EXPECT_EQ(checkers::makeMovie(plan, movie), "");
    return movie;
}

std::vector<std::string> SavingWorld::library() const {
    std::vector<std::string> found;
    for (const auto& entry : fs::recursive_directory_iterator(path("videos")))
        if (entry.path().filename() != "Lumacast") found.push_back(entry.path().string());
    std::sort(found.begin(), found.end());
    return found;
}

std::string SavingWorld::onlySaved() const {
    const auto saved = library();
    EXPECT_EQ(saved.size(), 1u) << ::testing::PrintToString(saved) << daemonLog();
    return saved.size() == 1 ? saved.front() : "";
}

std::vector<std::string> SavingWorld::temporaryFiles() const {
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator(temporaryDirectory()))
        names.push_back(entry.path().filename().string());
    return names;
}

std::string SavingWorld::temporaryDirectory() const { return fs::path(moviePath()).parent_path().string(); }

std::size_t SavingWorld::countInLog(const std::string& text) const {
    const std::string log = daemonLog();
    std::size_t count = 0;
    for (auto at = log.find(text); at != std::string::npos; at = log.find(text, at + 1)) ++count;
    return count;
}

std::vector<std::string> SavingWorld::saveStates() {
    std::vector<std::string> states;
    const auto status = World::status();
    if (status.contains("saves"))
        for (const auto& save : status["saves"]) states.push_back(save["state"].get<std::string>());
    return states;
}

void expectAllFrames(const std::string& movie) {
    checkers::FrameExpectation expectation;
    for (int i = 0; i < SavingWorld::kFrames; ++i)
        expectation.expected.insert(SavingWorld::kFirst + static_cast<std::uint32_t>(i));
    const auto report = checkers::checkFrameNumbers(picturesOf(movie), expectation);
    for (const auto& finding : report.findings) ADD_FAILURE() << finding.text;
    EXPECT_EQ(report.pictures, static_cast<std::size_t>(SavingWorld::kFrames));
}

}  // namespace lumacast::test
