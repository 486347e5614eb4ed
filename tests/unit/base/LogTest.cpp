#include "base/Log.h"

#include <gtest/gtest.h>

#include <thread>

namespace lumacast {
namespace {

struct Output {
    std::vector<std::pair<LogLevel, std::string>> lines;
    LogOutput sink() {
        return [this](LogLevel level, std::string_view text) { lines.emplace_back(level, text); };
    }
};

TEST(Log, LinesAreFormattedLikePrintf) {
    Output output;
    Log log(output.sink());
    log.line("plain");
    log.line("%d %i %u %ld", -1, 2L, 3u, std::int64_t{4});
    log.line("%zu", std::size_t{5});
    log.line("a %s b %@ c", std::string("text"), std::string_view("view"));
    log.line("%f and 100%%", 1.5);
    log.line("%u", std::uint64_t{18446744073709551615u});
    log.line("%d", true);
    const std::vector<std::string> expected{"plain", "-1 2 3 4", "5", "a text b view c", "1.500000 and 100%",
                                            "18446744073709551615", "1"};
    EXPECT_EQ(log.recentLines(), expected);
    ASSERT_EQ(output.lines.size(), expected.size());
    for (std::size_t i = 0; i < expected.size(); ++i) EXPECT_EQ(output.lines[i].second, expected[i]);
}

TEST(Log, EachLevelReachesTheOutputAsWhatItIs) {
    Output output;
    Log log(output.sink());
    log.line("default");
    log.error("error");
    log.print("print");
    ASSERT_EQ(output.lines.size(), 3u);
    EXPECT_EQ(output.lines[0].first, LogLevel::Default);
    EXPECT_EQ(output.lines[1].first, LogLevel::Error);
    EXPECT_EQ(output.lines[2].first, LogLevel::Print);
}

TEST(Log, LinesOfSamplesReachTheOutputOnlyWhenAskedForButAreKept) {
    Output output;
    Log log(output.sink());
    log.sample("frame %d", 1);
    log.debug("detail");
    EXPECT_TRUE(output.lines.empty());
    EXPECT_EQ(log.recentLines(), (std::vector<std::string>{"frame 1", "detail"}));
    log.setVerbose(true);
    log.sample("frame %d", 2);
    log.debug("more");
    ASSERT_EQ(output.lines.size(), 2u);
    EXPECT_EQ(output.lines[0], (std::pair{LogLevel::Sample, std::string("frame 2")}));
    log.setVerbose(false);
    log.sample("frame %d", 3);
    EXPECT_EQ(output.lines.size(), 2u);
}

TEST(Log, TheRingKeepsTheNewestLinesInOrder) {
    Log log({}, 3);
    for (int i = 1; i <= 2; ++i) log.line("%d", i);
    EXPECT_EQ(log.recentLines(), (std::vector<std::string>{"1", "2"}));
    for (int i = 3; i <= 7; ++i) log.line("%d", i);
    EXPECT_EQ(log.recentLines(), (std::vector<std::string>{"5", "6", "7"}));
}

TEST(Log, ArgumentsMayDieBeforeTheLineIsRead) {
    Log log;
    {
        const std::string text(100, 'x');
        log.sample("%s", text);
    }
    EXPECT_EQ(log.recentLines().front(), std::string(100, 'x'));
}

TEST(Log, AnOutputMayLogItself) {
    Log* itself = nullptr;
    int lines = 0;
    Log log([&](LogLevel, std::string_view) {
        if (++lines == 1) itself->line("from within");
    });
    itself = &log;
    log.line("first");
    EXPECT_EQ(lines, 2);
}

TEST(Log, ManyLanesMayLogAtOnce) {
    Log log({}, 64);
    std::vector<std::thread> lanes;
    for (int lane = 0; lane < 4; ++lane)
        lanes.emplace_back([&] {
            for (int i = 0; i < 500; ++i) {
                log.sample("%s %d", "line", i);
                if (i % 100 == 0) (void)log.recentLines();
            }
        });
    for (std::thread& lane : lanes) lane.join();
    EXPECT_EQ(log.recentLines().size(), 64u);
}

TEST(Log, ALongNumberIsNotCut) {
    Output output;
    Log log(output.sink());
    log.line("%f", -1.7976931348623157e308);
    EXPECT_EQ(output.lines[0].second.size(), 1u + 309u + 7u);
}

}  // namespace
}  // namespace lumacast
