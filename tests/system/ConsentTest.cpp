// The user is asked before a recording, in a real dialog with real clicks.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "tests/dialog/DialogUser.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;
using Button = DialogUser::Button;

class Consent : public ::testing::Test {
protected:
    Consent() { world_.startDaemon(); }

    std::unique_ptr<Application> shown(std::unique_ptr<Application> application) {
        EXPECT_TRUE(application->waitForFrame(1));
        return application;
    }
    std::unique_ptr<Application> application() {
        return shown(world_.application({"--size", "320x180", "--fps", "10"}));
    }
    DialogUser::Dialog dialog() {
        const auto found = user_.waitForDialog();
        EXPECT_TRUE(found) << world_.daemonLog();
        return found.value_or(DialogUser::Dialog{});
    }
    bool isRecording() { return !world_.recording().is_null(); }
    void expectRefused(Application& application) {
        EXPECT_THAT(application.answer(), StartsWith("error -5801")) << world_.daemonLog();
        EXPECT_FALSE(isRecording());
        EXPECT_TRUE(waitUntil([&] { return user_.dialogs().empty(); }));
    }

    World world_{World::Consent::Asked};
    DialogUser user_{world_.display().name()};
};

TEST_F(Consent, APressOfTheGrantingButtonLetsTheRecordingBeginAndIsRemembered) {
    const auto player = application();
    player->send("start");
    ASSERT_TRUE(user_.answer(Button::Default)) << world_.daemonLog();
    EXPECT_THAT(player->answer(), StartsWith("started")) << world_.daemonLog();
    ASSERT_TRUE(world_.waitForElapsed(0.5));
    EXPECT_FALSE(picturesOf(player->stop()).empty());
    // The next one begins without a question.
    EXPECT_THAT(player->ask("start"), StartsWith("started"));
    EXPECT_TRUE(user_.dialogs().empty());
}

TEST_F(Consent, APressOfTheOtherButtonRefuses) {
    const auto player = application();
    player->send("start");
    ASSERT_TRUE(user_.answer(Button::Other)) << world_.daemonLog();
    expectRefused(*player);
    EXPECT_THAT(world_.daemonLog(), HasSubstr("user refused recording"));
}

TEST_F(Consent, ClosingItKillingItAndDestroyingItsWindowRefuse) {
    const auto player = application();
    for (int way = 0; way < 5; ++way) {
        SCOPED_TRACE(way);
        player->send("start");
        const auto asked = dialog();
        switch (way) {
            case 0: user_.close(asked); break;
            case 1: ASSERT_TRUE(user_.killProgram(asked)); break;
            case 2: user_.destroy(asked); break;
            case 3: user_.killClient(asked); break;
            default: user_.press(asked, DialogUser::kEscape);
        }
        expectRefused(*player);
    }
}

TEST_F(Consent, TheDeathOfTheDisplayRefuses) {
    const auto player = application();
    player->send("start");
    (void)dialog();
    world_.display().kill();
    // The application may go before its dialog does.
    EXPECT_TRUE(waitUntil([&] {
        return world_.daemonLog().find("start request 1 refused with -580") != std::string::npos;
    })) << world_.daemonLog();
    EXPECT_EQ(world_.daemonLog().find("user acknowledged"), std::string::npos);
    EXPECT_FALSE(isRecording());
}

TEST_F(Consent, AClientThatDiesTakesItsDialogWithIt) {
    auto player = application();
    player->send("start");
    (void)dialog();
    player->kill();
    EXPECT_TRUE(waitUntil([&] { return user_.dialogs().empty(); })) << world_.daemonLog();
    EXPECT_TRUE(waitUntil([&] { return world_.status()["sessions"].empty(); }));
    EXPECT_FALSE(isRecording());
}

TEST_F(Consent, ASecondApplicationWaitsItsTurnAndIsNamed) {
    const auto player = application();
    const auto rival = shown(world_.otherApplication("Rival", {"--size", "320x180", "--fps", "10"}));
    rival->send("start");
    const auto first = dialog();
    ASSERT_EQ(player->ask("raise"), "ok");  // whoever asks is in front
    player->send("start");
    EXPECT_TRUE(waitUntil([&] { return world_.status()["startsWaitingForUser"] == 2; })) << world_.daemonLog();
    EXPECT_EQ(user_.dialogs().size(), 1u);
    ASSERT_TRUE(user_.answer(Button::Other, first.pid));
    EXPECT_THAT(rival->answer(), StartsWith("error -5801"));
    const auto second = dialog();
    EXPECT_NE(second.pid, first.pid);
    ASSERT_TRUE(user_.answer(Button::Default, second.pid));
    EXPECT_THAT(player->answer(), StartsWith("started")) << world_.daemonLog();
}

TEST_F(Consent, AnAnswerThatNeverComesKeepsNobodyElseWaiting) {
    const auto player = application();
    const auto rival = shown(world_.otherApplication("Rival", {"--size", "320x180", "--fps", "10"}));
    // The rival is known already.
    rival->send("start");
    ASSERT_TRUE(user_.answer(Button::Default)) << world_.daemonLog();
    EXPECT_THAT(rival->answer(), StartsWith("started"));
    ASSERT_TRUE(world_.waitForElapsed(0.5));
    EXPECT_FALSE(rival->stop().empty());
    ASSERT_EQ(player->ask("raise"), "ok");
    player->send("start");
    (void)dialog();
    EXPECT_EQ(world_.status()["startsWaitingForUser"], 1);
    EXPECT_THAT(rival->ask("state"), HasSubstr("isRecording")) << "it is served";
    player->kill();
    EXPECT_TRUE(waitUntil([&] { return user_.dialogs().empty(); }));
}

TEST_F(Consent, ATerminatedDaemonTakesItsDialogWithIt) {
    const auto player = application();
    player->send("start");
    (void)dialog();
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
    EXPECT_TRUE(waitUntil([&] { return user_.dialogs().empty(); }));
}

}  // namespace
}  // namespace lumacast::test
