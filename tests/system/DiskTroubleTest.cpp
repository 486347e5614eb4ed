// A disk that stops answering for ten seconds, and one that is full, under a recording.

#include <gtest/gtest.h>
#include <poll.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <map>
#include <sstream>

#include "tests/system/MovingWindow.h"
#include "tests/system/RawClient.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

using std::chrono::milliseconds;

#ifndef LC_SANITIZED
/// How long a request of another client may take, whatever the disk does.
constexpr milliseconds kAnswerWithin{50};
#endif
constexpr std::chrono::seconds kStall{10};

double inMilliseconds(std::chrono::nanoseconds time) {
    return std::chrono::duration<double, std::milli>(time).count();
}

/// Asks for the state again and again; the longest wait.
std::chrono::nanoseconds longestAnswer(RawClient& client, std::chrono::nanoseconds duration, std::size_t& answers) {
    std::chrono::nanoseconds longest{0};
    const auto end = std::chrono::steady_clock::now() + duration;
    while (std::chrono::steady_clock::now() < end) {
        const auto took = client.askForState();
        if (!took) {
            ADD_FAILURE() << "not served";
            break;
        }
        longest = std::max(longest, *took);
        ++answers;
        ::poll(nullptr, 0, 2);  // a pace, not a wait: hundreds of requests a second are enough
    }
    return longest;
}

TEST(DiskTrouble, AStallOfTenSecondsHoldsNobodyUpAndTheRecordingGoesOn) {
    World world;
    installThisProcess(world);
    world.startDaemon(world.troubledDisk());
    const auto application = world.application(kJudged);
    ASSERT_TRUE(application->waitForFrame(3));
    const std::uint32_t first = application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(1));
    RawClient other(world);
    ASSERT_TRUE(other.isConnected());
    std::size_t answers = 0;
    const auto before = longestAnswer(other, std::chrono::seconds(1), answers);

    const auto sizeOnDisk = [&] { return std::filesystem::file_size(world.moviePath()); };
    world.setDiskStalled(true);
    const std::uint32_t stalledFrom = application->askForFrame("frame");
    answers = 0;
    auto during = longestAnswer(other, kStall / 2, answers);
    const auto sizeAtHalf = sizeOnDisk();
    during = std::max(during, longestAnswer(other, kStall / 2, answers));
    EXPECT_EQ(sizeOnDisk(), sizeAtHalf) << "the disk does not stall";
    EXPECT_FALSE(world.recording().is_null()) << "it goes on";
    const std::uint32_t stalledTo = application->askForFrame("frame");
    world.setDiskStalled(false);
    EXPECT_TRUE(waitUntil([&] { return sizeOnDisk() > sizeAtHalf; }));

    ASSERT_TRUE(application->waitForFrame(stalledTo + 30));
    const std::uint32_t last = application->askForFrame("frame");
    const auto drawn = application->framesLog();
    const std::string movie = application->stop();
    ASSERT_FALSE(movie.empty()) << world.daemonLog();
    std::set<std::uint32_t> shown;
    for (const auto& picture : picturesOf(movie))
        if (picture.number) shown.insert(*picture.number);
    std::size_t lost = 0, lostInStall = 0, all = 0;
    for (const auto& [number, times] : drawn) {
        if (number <= first || number >= last) continue;
        ++all;
        if (shown.contains(number)) continue;
        ++lost;
        if (number >= stalledFrom && number <= stalledTo) ++lostInStall;
    }
    std::printf("stall of %lld s: %zu answers, the longest after %.1f ms (%.1f ms before it); of %zu frames %zu lost, "
                "%zu of them during the stall\n",
                static_cast<long long>(kStall.count()), answers, inMilliseconds(during), inMilliseconds(before), all,
                lost, lostInStall);
    RecordProperty("longest_answer_us", static_cast<int>(during.count() / 1000));
    RecordProperty("frames_lost", static_cast<int>(lost));
    EXPECT_GT(answers, 100u);
    EXPECT_GT(all, 50u);
    EXPECT_TRUE(shown.contains(last - 1)) << "what was drawn after the stall";
#ifndef LC_SANITIZED
    EXPECT_LE(during, kAnswerWithin);
    // What such a recording makes in ten seconds fits into what may wait for the disk.
    EXPECT_EQ(lost, 0u);
#endif
}

TEST(DiskTrouble, AQuotaThatIsUsedUpLeavesAMovieThatPlaysAndTheNextOneWorks) {
    World world;
    world.startDaemon(world.troubledDisk());
    const auto application = world.application(kJudged);
    ASSERT_TRUE(application->waitForFrame(3));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(1));
    world.setDiskQuotaUsedUp(true);
    ASSERT_TRUE(waitUntil([&] { return world.daemonLog().find("ERROR starting asset writer") != std::string::npos; }));
    const std::uint32_t from = application->askForFrame("frame");
    ASSERT_TRUE(application->waitForFrame(from + 30));
    // The client hears nothing of it before it stops; what was written until then plays.
    const std::string movie = application->stop();
    EXPECT_FALSE(picturesOf(movie, true).empty());
    // The prescribed line for each frame and each buffer of sound, and nothing else that repeats or comes from the port.
    std::map<std::string, std::size_t> lines;
    std::istringstream log(world.daemonLog());
    for (std::string line; std::getline(log, line);) {
        // A line that comes again and again is written once, and then how often it came.
        unsigned again = 0;
        int at = 0;
        if (std::sscanf(line.c_str(), "info repeated %u times: %n", &again, &at) == 1 && at > 0)
            lines["info " + line.substr(static_cast<std::size_t>(at))] += again;
        else
            ++lines[line];
    }
    for (const auto& [line, count] : lines) {
        if (line == "info ERROR starting asset writer") {
            // Sound comes fifty times a second.
            const double seconds = std::chrono::duration<double>(application->framesLog().rbegin()->second.shown -
                                                                 application->framesLog().begin()->second.sent)
                                       .count();
            EXPECT_LE(count, application->framesLog().size() + static_cast<std::size_t>(50 * seconds) + 10)
                << "once a frame, and once a buffer of sound";
        } else if (line == "info LCRecordingManager: Audio Queue buffer released") {
            EXPECT_EQ(count, 10u) << "once a buffer of the tap";
        } else {
            EXPECT_EQ(count, 1u) << line;
            // This world has no sound server, which the log says where the recording is long enough.
            EXPECT_FALSE(line.starts_with("error ") && !line.starts_with("error no sound server")) << line;
        }
    }
    world.setDiskQuotaUsedUp(false);
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(1));
    EXPECT_FALSE(picturesOf(application->stop()).empty());
}

TEST(DiskTrouble, AFullDiskStopsTheRecordingAndTheNextOneWorksOnceThereIsRoom) {
    World world;
    world.startDaemon(world.troubledDisk());
    const auto application = world.application(kJudged);
    ASSERT_TRUE(application->waitForFrame(3));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(0.5));
    world.setDiskFull(true);
    // Within ten seconds somebody looks at the space, and asks for it back.
    ASSERT_TRUE(waitUntil([&] { return world.recording().is_null(); }));
    EXPECT_TRUE(application->nextEvent().starts_with("event stopped -5805")) << world.daemonLog();
    EXPECT_TRUE(waitUntil([&] { return std::filesystem::is_empty(std::filesystem::path(world.moviePath()).parent_path()); }))
        << "every movie goes";
    EXPECT_TRUE(application->ask("start").starts_with("error -5805")) << "none begins";
    EXPECT_FALSE(world.status()["sessions"][0]["transactionOpen"].get<bool>());
    world.setDiskFull(false);
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(1));
    EXPECT_FALSE(picturesOf(application->stop()).empty());
}

}  // namespace
}  // namespace lumacast::test
