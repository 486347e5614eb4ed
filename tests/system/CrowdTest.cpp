// Many applications at once, and several connections of one.

#include <gtest/gtest.h>
#include <signal.h>

#include <filesystem>

#include "tests/system/RawClient.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;

#ifdef LC_SANITIZED
const std::vector<std::string> kShown{"--size", "320x180", "--fps", "6"};
constexpr int kApplications = 40, kAtATime = 10;
constexpr std::size_t kFramesMeanwhile = 3;
#else
const std::vector<std::string> kShown{"--size", "320x180", "--fps", "20"};
constexpr int kApplications = 200, kAtATime = 50;
constexpr std::size_t kFramesMeanwhile = 15;
#endif

/// Installs one program under many names, each an application of its own; their paths.
std::vector<std::string> installVisitors(World& world) {
    fs::create_directory(world.path("visitors"));
    const std::string program = world.path("visitors/visitor");
    fs::copy_file(LC_VISITOR, program);
    std::vector<std::string> programs;
    for (int i = 0; i < kApplications; ++i) {
        const std::string name = "Visitor" + std::to_string(i);
        programs.push_back(world.path("visitors/" + name));
        fs::create_hard_link(program, programs.back());
        world.install("org.lumacast." + name, name, programs.back());
    }
    return programs;
}

TEST(Crowd, OfApplicationsThatComeAskAndLeaveCostsARecordingNoFrameAndLeavesNothing) {
    World world;
    const auto programs = installVisitors(world);
    world.startDaemon();
    const auto application = world.application(kShown);
    ASSERT_TRUE(application->waitForFrame(3));
    const std::uint32_t first = application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(1));
    const std::size_t descriptors = world.daemonDescriptors(), threads = world.daemonNumber("Threads");

    std::size_t mostSessions = 0;
    for (int begin = 0; begin < kApplications; begin += kAtATime) {
        std::vector<std::unique_ptr<checkers::Child>> visitors;
        for (int i = begin; i < begin + kAtATime; ++i)
            visitors.push_back(std::make_unique<checkers::Child>(
                std::vector<std::string>{programs[static_cast<std::size_t>(i)]}, world.environment(),
                world.path("visitor.log")));
        for (const auto& visitor : visitors) EXPECT_EQ(visitor->readLine(std::chrono::seconds(60)), "state");
        mostSessions = std::max(mostSessions, world.status()["sessions"].size());
    }
    EXPECT_EQ(mostSessions, static_cast<std::size_t>(kAtATime) + 1) << "each an application of its own";
    EXPECT_TRUE(waitUntil([&] { return world.status()["sessions"].size() == 1; })) << world.status();
    EXPECT_TRUE(waitUntil([&] { return world.daemonDescriptors() <= descriptors; }))
        << descriptors << " before, now " << world.daemonDescriptors();
    EXPECT_TRUE(waitUntil([&] { return world.daemonNumber("Threads") <= threads; }))
        << threads << " before, now " << world.daemonNumber("Threads");

    const std::uint32_t last = application->askForFrame("frame");
    ASSERT_TRUE(application->waitForFrame(last + 2));
    const std::string movie = application->stop();
    checkers::FrameExpectation expectation;
    for (const auto& [number, times] : application->framesLog())
        if (number > first && number < last) expectation.expected.insert(number);
    EXPECT_GT(expectation.expected.size(), kFramesMeanwhile);
    expectation.allowedRepeats = 10;  // a frame that comes a second late is preceded by the last one again
    const auto report = checkers::checkFrameNumbers(picturesOf(movie), expectation);
    for (const auto& finding : report.findings) ADD_FAILURE() << finding.text;
    std::printf("%d applications, %d at a time: %zu frames drawn meanwhile, %zu lost\n", kApplications, kAtATime,
                expectation.expected.size(), report.missing.size());
}

TEST(Crowd, ANewConnectionOfAnApplicationReplacesTheOldOneAndItsRecordingGoesOn) {
    World world;
    world.startDaemon();
    const auto application = world.application(kShown);
    ASSERT_TRUE(application->waitForFrame(3));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(0.5));
    const std::size_t descriptors = world.daemonDescriptors();
    // The same program again: the same application, from another process.
    const auto newer = world.application(kShown);
    ASSERT_TRUE(newer->waitForFrame(1));
    const std::string state = newer->ask("state");
    EXPECT_NE(state.find("\"isRecording\" = 1"), std::string::npos) << state;
    EXPECT_EQ(application->nextEvent(), "event disconnected") << "the old one is closed";
    EXPECT_EQ(world.status()["sessions"].size(), 1u);
    EXPECT_TRUE(waitUntil([&] { return world.daemonDescriptors() <= descriptors; })) << "the newer in the older's place";
    const double elapsed = world.recording()["elapsedSeconds"].get<double>();
    ASSERT_TRUE(world.waitForElapsed(elapsed + 1)) << "the recording goes on";
    // Its movie is the newer connection's, from the first frame to the last.
    const std::string movie = newer->stop();
    ASSERT_FALSE(movie.empty());
    const auto drawn = application->framesLog();
    std::size_t shown = 0;
    for (const auto& picture : picturesOf(movie))
        if (picture.number && drawn.contains(*picture.number)) ++shown;
    EXPECT_GT(shown, 10u);
    // The old one's end does no more harm.
    application->kill();
    EXPECT_TRUE(newer->ask("state").starts_with("state "));
}

}  // namespace
}  // namespace lumacast::test
