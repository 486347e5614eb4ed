#include "linux/system/RepeatedLines.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <string>
#include <thread>
#include <vector>

#include "linux/system/LinuxLogSink.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

/// A sink into a file, with a clock of the test's own.
class RepeatedLog : public ::testing::Test {
protected:
    void write(std::string_view text, LogLevel level = LogLevel::Default) { sink_.write(level, text); }
    void pass(std::chrono::milliseconds time) { now_ += time; }
    std::string log() const { return ScratchDirectory::read(scratch_.path("log")); }

    const ScratchDirectory scratch_;
    const Fd file_{::open(scratch_.path("log").c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600)};
    std::chrono::steady_clock::time_point now_{1h};
    LinuxLogSink sink_{{.standardError = file_.get(),
                        .standardOutput = file_.get(),
                        .journalStream = "",
                        .journalSocket = "",
                        .now = [this] { return now_; }}};
};

TEST_F(RepeatedLog, ALineThatComesAgainAndAgainStandsOnceUntilAnotherComes) {
    for (int i = 0; i < 500; ++i) {
        write("a buffer has come");
        pass(10ms);
    }
    EXPECT_EQ(log(), "info a buffer has come\n");
    write("the end", LogLevel::Error);
    EXPECT_EQ(log(), "info a buffer has come\ninfo repeated 499 times: a buffer has come\nerror the end\n");
}

TEST_F(RepeatedLog, ARunThatGoesOnIsToldOfEveryTenSeconds) {
    for (int i = 0; i <= 1250; ++i) {
        write("a buffer has come");
        pass(20ms);
    }
    EXPECT_EQ(log(), "info a buffer has come\n"
                     "info repeated 500 times: a buffer has come\n"
                     "info repeated 500 times: a buffer has come\n");
    sink_.flush();
    EXPECT_TRUE(log().ends_with("info repeated 250 times: a buffer has come\n")) << log();
    sink_.flush();
    EXPECT_TRUE(log().ends_with("500 times: a buffer has come\ninfo repeated 250 times: a buffer has come\n"));
}

TEST_F(RepeatedLog, ALineThatComesTwiceStandsTwice) {
    write("twice");
    write("twice");
    write("once");
    EXPECT_EQ(log(), "info twice\ninfo twice\ninfo once\n");
}

TEST_F(RepeatedLog, ALineThatComesNowAndThenStandsAtOnceEachTime) {
    write("now and then");
    pass(10s);
    write("now and then");
    EXPECT_EQ(log(), "info now and then\ninfo now and then\n");
    pass(10s);
    write("now and then");
    EXPECT_EQ(log(), "info now and then\ninfo now and then\ninfo now and then\n");
}

TEST_F(RepeatedLog, LinesThatDifferInLevelOrTextAndLinesInTurnAreNotFolded) {
    write("a");
    write("a", LogLevel::Error);
    write("b", LogLevel::Error);
    write("a", LogLevel::Error);
    EXPECT_EQ(log(), "info a\nerror a\nerror b\nerror a\n");
}

TEST_F(RepeatedLog, PrintedLinesAreNotFoldedAndEndNoRun) {
    write("a");
    write("a");
    write("a");
    write("printed", LogLevel::Print);
    write("printed", LogLevel::Print);
    write("b");
    EXPECT_EQ(log(), "info a\nprinted\nprinted\ninfo repeated 2 times: a\ninfo b\n");
}

TEST_F(RepeatedLog, ANoteFitsIntoAPipesWholeWritesHoweverLongTheLine) {
    const std::string longest(5000, 'x');
    for (int i = 0; i < 4; ++i) write(longest);
    sink_.flush();
    const std::string kept(4000, 'x');
    EXPECT_EQ(log(), "info " + kept + "\ninfo repeated 3 times: " + kept + "\n");
}

TEST(RepeatedLines, LanesLoseNoRepeatBetweenThem) {
    RepeatedLines lines;
    std::atomic<std::uint64_t> written{0}, told{0};
    const auto note = [&](const std::optional<RepeatedLines::Line>& line) {
        if (!line) return;
        // Only one at a time stands as it is.
        if (line->text == "line") ++told;
        else told += std::stoul(line->text.substr(std::string("repeated ").size()));
    };
    std::vector<std::thread> lanes;
    for (int lane = 0; lane < 4; ++lane)
        lanes.emplace_back([&, lane] {
            for (int i = 0; i < 2'000; ++i) {
                const auto folded = lines.take(LogLevel::Default, "line", RepeatedLines::Moment{std::chrono::hours(1)});
                note(folded.before);
                written += folded.isWritten;
                if (lane == 0 && i % 10 == 0) note(lines.end());
            }
        });
    for (auto& lane : lanes) lane.join();
    note(lines.end());
    EXPECT_EQ(written + told, 8'000u);
}

}  // namespace
}  // namespace lumacast
