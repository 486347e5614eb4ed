// How recordings of the whole display end: by the next tool, by a locked screen; and what the usage says of it.

#include <gmock/gmock.h>
#include <signal.h>
#include <xcb/xcb.h>

#include <cstdlib>

#include "tests/checkers/ToneChecker.h"
#include "tests/dialog/DialogUser.h"
#include "tests/system/DisplayTool.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using checkers::Child;
using ::testing::HasSubstr;

struct FreeReply {
    void operator()(void* reply) const { std::free(reply); }
};
template <class Of>
using Reply = std::unique_ptr<Of, FreeReply>;

class DisplayEndings : public DisplayTool {
protected:
    DisplayEndings() : DisplayTool("800x600x24") { entitle(); }

    std::string path() {
        const auto current = world_.recording();
        return current.is_null() ? "" : current["path"].get<std::string>();
    }
    bool waitForRecording(double seconds) {
        return waitUntil([&] { return elapsed() >= seconds; }, std::chrono::seconds(60));
    }
    nlohmann::json usage() {
        const auto asked = run({"usage", "--json"});
        const std::string out = asked->readAll();
        EXPECT_EQ(asked->wait(), 0) << out;
        return nlohmann::json::parse(out, nullptr, false)["events"];
    }
    void expectOneEvent(int reason) {
        nlohmann::json events;
        EXPECT_TRUE(waitUntil([&] {
            events = usage();
            return events.size() == 1;
        })) << events << world_.daemonLog();
        if (events.size() != 1) return;
        EXPECT_EQ(events[0]["type"], 1) << events;
        EXPECT_EQ(events[0]["serviceName"], "SystemRecording") << events;
        const auto& payload = events[0]["payload"];
        EXPECT_EQ(payload.size(), 15u) << events;
        EXPECT_EQ(payload["EndReason"], reason) << events;
        EXPECT_EQ(payload["VideoCaptureWidth"], 800) << events;
        EXPECT_EQ(payload["VideoCaptureHeight"], 600) << events;
        EXPECT_GE(payload["ActiveDuration"].get<int>(), 1) << events;
    }
    /// Whether a window manager has the display by now.
    bool waitForManager() {
        const std::unique_ptr<xcb_connection_t, decltype(&xcb_disconnect)> display(
            xcb_connect(world_.display().name().c_str(), nullptr), &xcb_disconnect);
        const xcb_window_t root = xcb_setup_roots_iterator(xcb_get_setup(display.get())).data->root;
        const std::string name = "_NET_SUPPORTING_WM_CHECK";
        const Reply<xcb_intern_atom_reply_t> atom(xcb_intern_atom_reply(
            display.get(), xcb_intern_atom(display.get(), 0, static_cast<std::uint16_t>(name.size()), name.c_str()),
            nullptr));
        return atom && waitUntil([&] {
            const Reply<xcb_get_property_reply_t> manager(xcb_get_property_reply(
                display.get(),
                xcb_get_property(display.get(), 0, root, atom->atom, XCB_GET_PROPERTY_TYPE_ANY, 0, 1), nullptr));
            return manager && manager->type != XCB_ATOM_NONE;
        });
    }
    /// As a locked screen does.
    void blankTheScreen() {
        xcb_connection_t* const display = xcb_connect(world_.display().name().c_str(), nullptr);
        xcb_force_screen_saver(display, XCB_SCREEN_SAVER_ACTIVE);
        std::free(xcb_get_input_focus_reply(display, xcb_get_input_focus(display), nullptr));  // it has been done
        xcb_disconnect(display);
    }
};

TEST_F(DisplayEndings, TheSecondOfTwoToolsRecordsInThePlaceOfTheFirstThatWasKilledAndStopsItsOwn) {
    askNobody();
    world_.startDaemon();
    const auto first = tool({});
    ASSERT_TRUE(waitForRecording(1.5)) << world_.daemonLog() << complaints();
    const std::string pathOfFirst = path();
    ASSERT_GT(first->pid(), 1);
    ::kill(first->pid(), SIGKILL);
    EXPECT_EQ(first->wait(), -1);
    ASSERT_FALSE(path().empty()) << "it goes on";

    const std::string movie = world_.path("second.mp4");
    const auto second = tool({"--output", movie});
    ASSERT_TRUE(waitUntil([&] { return !path().empty() && path() != pathOfFirst; })) << complaints();
    ASSERT_TRUE(waitForRecording(1.5)) << world_.daemonLog() << complaints();
    ASSERT_GT(second->pid(), 1);
    ::kill(second->pid(), SIGINT);
    EXPECT_EQ(second->wait(), 0) << complaints() << world_.daemonLog();
    EXPECT_EQ(second->readAll(), movie + "\n");
    EXPECT_EQ(complaints().find("interrupted"), std::string::npos) << complaints();
    EXPECT_TRUE(waitUntil([&] { return world_.recording().is_null(); })) << "nobody could stop it";
    EXPECT_EQ(checkers::MovieReader(movie).videoTracks().size(), 1u);
    // The first one's is in the library, as that of any recording of the display that another takes the place of.
    const fs::path library = world_.path("videos/Lumacast");
    ASSERT_TRUE(waitUntil([&] { return fs::exists(library) && !fs::is_empty(library); })) << world_.daemonLog();
    EXPECT_TRUE(waitUntil([&] { return !fs::exists(pathOfFirst); }));
}

TEST_F(DisplayEndings, AStopLeavesALineOfItsOwnKind) {
    askNobody();
    world_.startDaemon();
    const auto recorder = tool({"--duration", "2", "--output", world_.path("display.mp4")});
    EXPECT_EQ(recorder->wait(), 0) << complaints() << world_.daemonLog();
    expectOneEvent(0);
}

TEST_F(DisplayEndings, AScreenThatIsLockedEndsItAndTheToolSaysWhy) {
    askNobody();
    world_.startDaemon();
    const auto recorder = tool({});
    ASSERT_TRUE(waitForRecording(1.5)) << world_.daemonLog() << complaints();
    const std::string movie = path();
    blankTheScreen();
    EXPECT_EQ(recorder->wait(), 6) << world_.daemonLog();
    EXPECT_THAT(complaints(), HasSubstr("the recording was ended by the daemon: "));
    EXPECT_THAT(complaints(), HasSubstr(movie)) << "where it is";
    EXPECT_TRUE(waitUntil([&] { return world_.daemonLog().find("clientDidResignActive") != std::string::npos; }))
        << "some time later the user is to be asked again";
    expectOneEvent(-5806);
    EXPECT_TRUE(fs::exists(movie));
}

TEST_F(DisplayEndings, AScreenThatIsLockedWhenTheToolHasGoneLeavesTheMovieWhereTheLogSays) {
    askNobody();
    world_.startDaemon();
    const auto recorder = tool({});
    ASSERT_TRUE(waitForRecording(1.5)) << world_.daemonLog() << complaints();
    const std::string movie = path();
    ASSERT_GT(recorder->pid(), 1);
    ::kill(recorder->pid(), SIGKILL);
    EXPECT_EQ(recorder->wait(), -1);
    ASSERT_TRUE(waitUntil([&] { return !world_.status()["sessions"][0]["connected"].get<bool>(); }));
    blankTheScreen();
    ASSERT_TRUE(waitUntil([&] { return world_.recording().is_null(); })) << world_.daemonLog();
    EXPECT_TRUE(waitUntil([&] { return world_.daemonLog().find("its movie is " + movie) != std::string::npos; }))
        << world_.daemonLog();
    EXPECT_TRUE(fs::exists(movie));
    // From there it can be had.
    const auto saving = run({"save", movie});
    EXPECT_EQ(saving->wait(), 0) << complaints() << world_.daemonLog();
    EXPECT_EQ(checkers::MovieReader(saving->readLine()).videoTracks().size(), 1u);
}

TEST_F(DisplayEndings, UnderAWindowManagerTheSoundIsThatOfWhatCameInFrontWhileTheUserWasAsked) {
    world_.startDaemon();
    // Without one that it can read it opens a window to say so, which would be in front.
    const std::string configuration = world_.path("openbox.xml");
    std::ofstream(configuration) << "<openbox_config xmlns=\"http://openbox.org/3.4/rc\"></openbox_config>\n";
    const Child manager({"openbox", "--config-file", configuration}, world_.environment(), world_.path("openbox.log"));
    ASSERT_TRUE(waitForManager());
    const std::string movie = world_.path("display.mp4");
    const auto recorder = tool({"--output", movie});
    DialogUser user(world_.display().name());
    const auto dialog = user.waitForDialog();
    ASSERT_TRUE(dialog) << world_.daemonLog() << complaints();
    const auto player = world_.otherApplication("Player", {"--size", "320x180", "--fps", "10", "--tone", "700"});
    ASSERT_TRUE(player->waitForFrame(5));
    ASSERT_TRUE(user.click(*dialog, DialogUser::Button::Default));
    ASSERT_TRUE(waitForRecording(3)) << world_.daemonLog() << complaints();
    ASSERT_GT(recorder->pid(), 1);
    ::kill(recorder->pid(), SIGINT);
    EXPECT_EQ(recorder->wait(), 0) << complaints() << world_.daemonLog();
    const auto sound = checkers::MovieReader(movie).readSound();
    ASSERT_TRUE(sound) << world_.daemonLog();
    const std::vector<float> later(sound->samples.begin() + std::ssize(sound->samples) / 2, sound->samples.end());
    const double level = checkers::toneLevel(later, sound->rate, 700);
    std::printf("    its tone: %.0f dB\n", level);
    EXPECT_GT(level, -25);
}

}  // namespace
}  // namespace lumacast::test
