// Who records when several want to: through the real daemon.

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>

#include "tests/system/MovingWindow.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

/// What a client hears of a recording that another start has ended; its movie is not handed out.
constexpr char kTakenOver[] = "event stopped -5806";

void expectPlays(const std::string& movie, std::uint32_t from, std::uint32_t to) {
    const auto pictures = picturesOf(movie);
    ASSERT_FALSE(pictures.empty());
    // The very first picture shows what had stood there before the start.
    for (auto picture = std::next(pictures.begin()); picture != pictures.end(); ++picture) {
        ASSERT_TRUE(picture->number);
        EXPECT_GE(*picture->number, from);
        EXPECT_LE(*picture->number, to);
    }
}

TEST(Competition, TheSecondApplicationTakesOverAndTheFirstIsTold) {
    World world;
    world.startDaemon();
    const auto first = world.application(kMoving);
    ASSERT_TRUE(first->waitForFrame(1));
    (void)first->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(0.5));
    const auto second = world.otherApplication("Rival", kMoving);
    ASSERT_TRUE(second->waitForFrame(1));
    const std::uint32_t from = second->askForFrame("start");
    EXPECT_TRUE(first->nextEvent().starts_with(kTakenOver)) << world.daemonLog();
    EXPECT_TRUE(waitUntil([&] { return !std::filesystem::exists(world.moviePath()); }))
        << "the interrupted movie is discarded";
    ASSERT_TRUE(second->waitForFrame(from + 20));
    const std::string movie = second->stop();
    EXPECT_EQ(std::filesystem::path(movie).filename(), "Rival.mp4");
    expectPlays(movie, from, second->askForFrame("frame"));
    const auto isFree = [&] {
        const auto sessions = world.status()["sessions"];
        return std::none_of(sessions.begin(), sessions.end(), [](const auto& session) {
            return session["transactionOpen"].template get<bool>() || session["recording"].template get<bool>();
        });
    };
    EXPECT_TRUE(waitUntil(isFree)) << world.status();
    // The first one can record again.
    EXPECT_EQ(second->ask("hide"), "ok");
    (void)first->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(0.5));
    EXPECT_FALSE(picturesOf(first->stop()).empty());
}

TEST(Competition, AnApplicationThatStartsAgainKeepsItsLastMovieWhole) {
    World world;
    world.startDaemon();
    const auto application = world.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world.waitForElapsed(1.0));
    const std::uint32_t from = application->askForFrame("start");
    EXPECT_TRUE(application->nextEvent().starts_with(kTakenOver));
    ASSERT_TRUE(application->waitForFrame(from + 30));
    const std::string movie = application->stop();
    // The answer to the start may come a frame or two after the first picture.
    expectPlays(movie, from - std::min(from, 3u), application->askForFrame("frame"));
}

TEST(Competition, TwoStartsBeforeTheFirstIsAnsweredAreBothAnsweredAndTheLastOneCounts) {
    World world;
    world.startDaemon();
    const auto application = world.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    ASSERT_TRUE(application->ask("state").starts_with("state "));
    application->send("start");
    application->send("start");
    EXPECT_TRUE(application->answer().starts_with("started frame "));
    const std::string second = application->answer();
    ASSERT_TRUE(second.starts_with("started frame ")) << second;
    EXPECT_TRUE(application->nextEvent().starts_with(kTakenOver));
    ASSERT_TRUE(world.waitForElapsed(1.0));
    const std::string movie = application->stop();
    const auto pictures = picturesOf(movie);
    EXPECT_GT(pictures.size(), 15u);
    EXPECT_EQ(application->ask("discard"), "discarded");
    EXPECT_FALSE(std::filesystem::exists(movie));
}

TEST(Competition, TheStateIsThatOfTheOneWhoAsks) {
    World world;
    world.startDaemon();
    const auto first = world.application(kMoving);
    ASSERT_TRUE(first->waitForFrame(1));
    (void)first->askForFrame("start");
    const auto second = world.otherApplication("Rival", kMoving);
    ASSERT_TRUE(second->waitForFrame(1));
    const std::string recording = first->ask("state"), idle = second->ask("state");
    EXPECT_NE(recording.find("\"isRecording\" = 1"), std::string::npos) << recording;
    EXPECT_NE(idle.find("\"isRecording\" = 0"), std::string::npos) << idle;
    EXPECT_EQ(idle.find("broadcastURL"), std::string::npos) << "left out when there is none";
}

}  // namespace
}  // namespace lumacast::test
