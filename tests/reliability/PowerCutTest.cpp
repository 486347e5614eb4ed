// The power goes at each moment of a recording: what was synced plays, and what had been shown a second before is in it.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <set>

#include "linux/media/UnfinishedMovies.h"
#include "tests/checkers/BoxChecker.h"
#include "tests/reliability/LostPower.h"
#include "tests/reliability/Scenario.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using std::chrono::nanoseconds;

/// What a machine that stands still adds to the second that is promised.
constexpr std::chrono::milliseconds kStall{1500};

TEST(LostPower, KeepsWhatWasSyncedAndAnythingOfTheRest) {
    using Kind = JournalEntry::Kind;
    LostPower disk;
    disk.add({Kind::Make, "/d/a", "", 0, "", 0});
    disk.add({Kind::Write, "/d/a", "", 0, std::string(700, 'a'), 0});
    disk.add({Kind::Sync, "/d/a", "", 0, "", 0});
    EXPECT_TRUE(disk.filesBelow("/d", LostPower::Rest::Gone, 1).empty()) << "a name that was not synced";
    disk.add({Kind::Sync, "/d", "", 0, "", 0});
    disk.add({Kind::Write, "/d/a", "", 600, std::string(600, 'b'), 0});
    const auto content = [&](LostPower::Rest rest) { return disk.filesBelow("/d", rest, 1).at("a"); };
    EXPECT_EQ(content(LostPower::Rest::Gone), std::string(700, 'a'));
    EXPECT_EQ(content(LostPower::Rest::There), std::string(600, 'a') + std::string(512, 'b') + std::string(88, '\0'))
        << "sectors to 1024, then half of the last 176 bytes";
    EXPECT_EQ(content(LostPower::Rest::Zeros), std::string(700, 'a') + std::string(500, '\0'));
    disk.add({Kind::Rename, "/d/a", "/d/b", 0, "", 0});
    EXPECT_TRUE(disk.filesBelow("/d", LostPower::Rest::Gone, 1).contains("a"));
    disk.add({Kind::Sync, "/d", "", 0, "", 0});
    EXPECT_TRUE(disk.filesBelow("/d", LostPower::Rest::Gone, 1).contains("b"));
    disk.add({Kind::Remove, "/d/b", "", 0, "", 0});
    EXPECT_TRUE(disk.filesBelow("/d", LostPower::Rest::Gone, 1).contains("b"));
    EXPECT_FALSE(disk.filesBelow("/d", LostPower::Rest::There, 1).contains("b"));
}

/// The recording of a window, and what it did to the disk.
class PowerCut : public ::testing::Test {
protected:
    void record(const std::vector<std::string>& window, double seconds) {
        std::ofstream(scenario_->faultsFolder() + "/journal");
        scenario_->startFaulty(std::nullopt, std::nullopt);
        auto& world = scenario_->world();
        const auto app = world.application(window);
        ASSERT_TRUE(app->waitForFrame(1));
        std::string answer;  // a busy machine refuses a start now and then
        const std::string started = "started frame ";
        ASSERT_TRUE(waitUntil([&] { return (answer = app->ask("start")).starts_with(started); }, std::chrono::seconds(30))) << answer;
        first_ = static_cast<std::uint32_t>(std::stoul(answer.substr(started.size())));
        ASSERT_TRUE(world.waitForElapsed(seconds));
        ASSERT_FALSE(app->stop().empty());
        drawn_ = app->framesLog();
        const auto journal = readJournal(scenario_->faultsFolder() + "/journal");
        ASSERT_TRUE(journal);
        journal_ = *journal;
        ASSERT_GT(journal_.size(), 8u);
        EXPECT_EQ(world.endDaemon(SIGTERM), 0);
    }

    /// Cuts the power after each entry, in each way.
    void cutEverywhere() {
        LostPower disk;
        const std::string folder = scenario_->world().temporaryDirectory();
        std::size_t cuts = 0, playing = 0;
        nanoseconds mostLost{0};
        bool isSynced = false;  // until then there is no movie, whatever stands in its file
        for (std::size_t i = 0; i < journal_.size(); ++i) {
            disk.add(journal_[i]);
            isSynced |= journal_[i].kind == JournalEntry::Kind::Sync && journal_[i].path.ends_with(".mp4");
            for (const auto rest : {LostPower::Rest::Gone, LostPower::Rest::There, LostPower::Rest::Zeros, LostPower::Rest::Any}) {
                SCOPED_TRACE("after entry " + std::to_string(i) + ", rest " + std::to_string(static_cast<int>(rest)));
                ++cuts;
                const auto left = disk.filesBelow(folder, rest, static_cast<std::uint32_t>(i));
                ASSERT_LE(left.size(), 1u);
                std::set<std::uint32_t> shown;
                if (isSynced && !left.empty()) playing += play(left.begin()->second, shown) ? 1 : 0;
                mostLost = std::max(mostLost, lostAt(nanoseconds(static_cast<std::int64_t>(journal_[i].time)), shown));
            }
        }
        std::printf("    %zu entries, %zu cuts, %zu with a movie that plays; the most that was lost: %.0f ms; the next starts find %zu "
                    "pictures more\n", journal_.size(), cuts, playing, std::chrono::duration<double, std::milli>(mostLost).count(), gained_);
        RecordProperty("most_lost_ms", static_cast<int>(mostLost.count() / 1'000'000));
        EXPECT_GT(playing, cuts / 2);
        EXPECT_LE(mostLost, std::chrono::seconds(1) + kStall);
    }

    /// Cuts the power after each entry: how long what is left plays, without a look at the next start.
    void measureLengths() {
        LostPower disk;
        const std::string folder = scenario_->world().temporaryDirectory();
        std::vector<nanoseconds> lengths;
        for (std::size_t i = 0; i < journal_.size(); ++i) {
            disk.add(journal_[i]);
            const auto left = disk.filesBelow(folder, LostPower::Rest::Gone, static_cast<std::uint32_t>(i));
            lengths.push_back(left.empty() ? nanoseconds(0) : lengthOf(left.begin()->second));
        }
        // The movie began when it is longest for its time; what is left of it is all there is until the next entry.
        const auto timeOf = [&](std::size_t i) { return nanoseconds(static_cast<std::int64_t>(journal_[i].time)); };
        nanoseconds begin = nanoseconds::max();
        for (std::size_t i = 0; i < journal_.size(); ++i)
            if (lengths[i].count() > 0) begin = std::min(begin, timeOf(i) - lengths[i]);
        for (std::size_t i = 0; i + 1 < journal_.size(); ++i)
            if (lengths[i].count() > 0) mostMissing_ = std::max(mostMissing_, timeOf(i + 1) - begin - lengths[i]);
        std::printf("    %zu entries; the most that was missing: %.0f ms\n", journal_.size(),
                    std::chrono::duration<double, std::milli>(mostMissing_).count());
        RecordProperty("most_missing_ms", static_cast<int>(mostMissing_.count() / 1'000'000));
    }
    std::size_t syncsOfTheMovie() const {
        return static_cast<std::size_t>(std::count_if(journal_.begin(), journal_.end(), [](const JournalEntry& entry) {
            return entry.kind == JournalEntry::Kind::Sync && entry.path.ends_with(".mp4");
        }));
    }
    double secondsOfTheJournal() const { return static_cast<double>(journal_.back().time - journal_.front().time) / 1e9; }
    nanoseconds mostMissing_{0};

private:
    nanoseconds lengthOf(const std::string& bytes) const {
        const std::string movie = scenario_->world().path("cut.mp4");
        std::ofstream(movie, std::ios::binary | std::ios::trunc) << bytes;
        checkers::MovieReader reader(movie);
        return reader.error().empty() ? reader.duration() : nanoseconds(0);
    }
    /// Whether there is a picture in it, and after the look of the next start all those that were there before; fails the test
    /// for what a decoder complains of.
    bool play(const std::string& bytes, std::set<std::uint32_t>& shown) {
        const std::string folder = scenario_->world().path("after the cut"), movie = folder + "/cut.mp4";
        fs::create_directory(folder);
        std::ofstream(movie, std::ios::binary | std::ios::trunc) << bytes;
        shown = numbersIn(movie);
        media::UnfinishedMovies unfinished(folder, log_);
        unfinished.remember();
        unfinished.begin();
        unfinished.wait();
        const auto after = numbersIn(movie);
        EXPECT_TRUE(std::includes(after.begin(), after.end(), shown.begin(), shown.end())) << "the next start loses pictures";
        if (!shown.empty()) {
            const auto report = checkers::checkBoxes(movie);
            EXPECT_THAT(report.findings, ::testing::IsEmpty());
            EXPECT_EQ(report.topLevel, (std::vector<std::string>{"ftyp", "mdat", "moov"}));
        }
        gained_ += after.size() - shown.size();
        return !shown.empty();
    }
    static std::set<std::uint32_t> numbersIn(const std::string& movie) {
        checkers::MovieReader reader(movie);
        EXPECT_EQ(reader.error(), "");
        std::vector<checkers::NumberedPicture> pictures;
        EXPECT_TRUE(checkers::readFrameNumbers(reader, pictures)) << reader.error();
        std::set<std::uint32_t> numbers;
        for (const auto& picture : pictures) {
            EXPECT_TRUE(picture.number);
            if (picture.number) numbers.insert(*picture.number);
        }
        return numbers;
    }
    /// How long before `time` the first frame was shown that belongs into the movie and is not there, of those after the last
    /// one that is.
    nanoseconds lostAt(nanoseconds time, const std::set<std::uint32_t>& shown) const {
        const std::uint32_t last = shown.empty() ? first_ : *shown.rbegin();
        for (auto each = drawn_.upper_bound(std::max(last, first_)); each != drawn_.end(); ++each)
            if (each->second.shown < time) return time - each->second.shown;
            else break;
        return nanoseconds(0);
    }

    const std::unique_ptr<Scenario> scenario_ = plainMovie();
    std::uint32_t first_ = 0;
    checkers::FramesLog drawn_;
    std::vector<JournalEntry> journal_;
    std::size_t gained_ = 0;  ///< pictures that nobody had synced and the next start found whole
    Log log_{[](LogLevel level, std::string_view text) {
        if (level == LogLevel::Error) ADD_FAILURE() << text;
    }};
};

TEST_F(PowerCut, LosesASecondOfAMovingWindow) {
    record({"--size", "320x180", "--fps", "60"}, 3);
    cutEverywhere();
}

TEST_F(PowerCut, LosesASecondOfAWindowThatMovesTenTimesASecond) {
    record({"--size", "320x180", "--fps", "10"}, 3);
    cutEverywhere();
}

TEST_F(PowerCut, LosesASecondOfAWindowThatChangesNowAndThen) {
    record({"--size", "320x180", "--fps", "1"}, 4);
    cutEverywhere();
}

TEST_F(PowerCut, LosesASecondOfAStillWindowThoughTheDiskIsWokenOncePerPicture) {
    record({"--size", "320x180", "--still"}, 8);
    measureLengths();
    EXPECT_LE(mostMissing_, std::chrono::seconds(1) + kStall);
    // A picture each 0.9 s, synced and shown, and some more at the beginning and at the end.
    const double seconds = secondsOfTheJournal();
    EXPECT_LE(static_cast<double>(syncsOfTheMovie()), 2 * seconds / 0.9 + 6) << "in " << seconds << " s";
}

}  // namespace
}  // namespace lumacast::test
