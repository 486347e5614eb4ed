// Which application is in front on an X11 desktop, with a window manager and without.

#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "tests/contract/AppStateWorld.h"

namespace lumacast {
namespace {

using test::becomes;
using test::isBehind;
using test::isInFront;
using test::kFirst;
using test::kSecond;
using test::kTool;
using test::PortAppStateWorld;
using test::Updates;

class X11AppState : public ::testing::Test {
protected:
    void waitForManager() {
        test::TestWindow helper(world_.display().name(), {.mapped = false});
        ASSERT_TRUE(becomes([&] {
            const char name[] = "_NET_SUPPORTING_WM_CHECK";
            const x11::Owned<xcb_intern_atom_reply_t> atom(xcb_intern_atom_reply(
                helper.connection(), xcb_intern_atom(helper.connection(), 0, sizeof name - 1, name), nullptr));
            const x11::Owned<xcb_get_property_reply_t> property(xcb_get_property_reply(
                helper.connection(),
                xcb_get_property(helper.connection(), 0, helper.screen().root, atom->atom, XCB_ATOM_WINDOW, 0, 1),
                nullptr));
            return property && property->value_len == 1;
        }));
    }
    std::shared_ptr<Updates> listen() { return test::listenTo(world_); }
    /// Has the window manager activate a window, again and again: a request for one that it has not taken note of yet
    /// is lost.
    void activate(ContextID window, const BundleIdentifier& front, const BundleIdentifier& behind) {
        EXPECT_TRUE(becomes([&] {
            const test::ChildProcess command({"xdotool", "windowactivate", std::to_string(number(window))}, -1,
                                             {"DISPLAY=" + world_.display().name()});
            becomes([&] { return command.ended(); });
            return isInFront(monitor_, front) && isBehind(monitor_, behind);
        }));
    }
    PortAppStateWorld world_;
    AppStateMonitor& monitor_ = world_.monitor();
};

TEST_F(X11AppState, AToolIsInFrontWhenItsTerminalIs) {
    world_.openTwoApplications();
    EXPECT_TRUE(becomes([&] { return isInFront(monitor_, kTool); }));
    world_.bringSecondToFront();
    EXPECT_TRUE(becomes([&] { return isBehind(monitor_, kTool); }));
}

TEST_F(X11AppState, AToolIsInFrontWhenNothingIsActive) {
    world_.openTwoApplications();
    const test::ChildProcess tool({"sleep", "1000"});
    world_.name(kTool, {ProcessID{tool.pid()}});
    ASSERT_TRUE(becomes([&] { return isBehind(monitor_, kTool); }));
    world_.first().reset();
    world_.second().reset();
    EXPECT_TRUE(becomes([&] { return isInFront(monitor_, kTool); }));
}

TEST_F(X11AppState, SeveralProcessesOfAnApplicationCountAsOne) {
    world_.openTwoApplications();
    world_.name(kFirst, {ProcessID{1}, world_.first()->pid()});
    EXPECT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
}

TEST_F(X11AppState, TellsWhenAnApplicationHasEnded) {
    world_.openTwoApplications();
    const auto updates = listen();
    ASSERT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    const ProcessID first = world_.first()->pid();
    world_.first().reset();
    EXPECT_TRUE(becomes([&] { return updates->has(false, first, X11AppStateMonitor::kEnded); }));
    EXPECT_TRUE(becomes([&] { return updates->has(true, world_.second()->pid()); }));
}

TEST_F(X11AppState, BelievesTheWindowManager) {
    const test::ChildProcess manager({"openbox", "--config-file", "/dev/null"}, -1,
                                     {"DISPLAY=" + world_.display().name()});
    waitForManager();
    world_.openTwoApplications();
    const auto updates = listen();
    activate(world_.second()->window(), kSecond, kFirst);
    activate(world_.first()->window(), kFirst, kSecond);
    EXPECT_TRUE(becomes([&] { return updates->has(true, world_.first()->pid()); }));
    EXPECT_TRUE(becomes([&] { return isInFront(monitor_, kTool); })) << "its ancestor is";
}

TEST_F(X11AppState, TellsWhenAnApplicationEndsThatWasNeverInFront) {
    world_.openTwoApplications();
    const auto updates = listen();
    ASSERT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    const ProcessID second = world_.second()->pid();
    world_.second().reset();
    EXPECT_TRUE(becomes([&] { return updates->has(false, second, AppStateMonitor::kEnded); }));
    EXPECT_EQ(updates->count(), 1u) << "and nothing else has changed";
}

TEST_F(X11AppState, AnotherWindowOfTheSameProcessIsNoChange) {
    world_.openTwoApplications();
    const auto updates = listen();
    ASSERT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    const ProcessID self{::getpid()};
    test::TestWindow one(world_.display().name(), {}), another(world_.display().name(), {});
    ASSERT_TRUE(becomes([&] { return updates->has(true, self); }));
    one.raise();
    another.raise();
    world_.bringSecondToFront();
    EXPECT_TRUE(becomes([&] { return updates->has(true, world_.second()->pid()); }));
    EXPECT_TRUE(updates->has(false, self));
    EXPECT_EQ(updates->count(), 4u) << "to this process and on to the second application";
}

TEST_F(X11AppState, AnotherProcessOfTheSameApplicationTakesOverWithoutAnyoneLeaving) {
    world_.openTwoApplications();
    world_.name(kFirst, {world_.first()->pid(), world_.second()->pid()});
    const auto updates = listen();
    ASSERT_TRUE(becomes([&] { return monitor_.applicationProcess(kFirst) == world_.first()->pid(); }));
    world_.bringSecondToFront();
    EXPECT_TRUE(becomes([&] { return updates->has(true, world_.second()->pid()); }));
    EXPECT_TRUE(isInFront(monitor_, kFirst));
    EXPECT_EQ(monitor_.applicationProcess(kFirst), world_.second()->pid()) << "the one in front";
    world_.mainQueue().sync([] {});
    EXPECT_EQ(updates->count(), 1u) << "the application has not left the front";
}

TEST_F(X11AppState, TellsOfTheFrontComingFromNothingAndGoingBackToIt) {
    const auto updates = listen();
    ASSERT_TRUE(becomes([&] { return !monitor_.frontmostApplication(); }));
    const test::XClientProcess application(world_.display().name());
    world_.name(kFirst, {application.pid()});
    EXPECT_TRUE(becomes([&] { return updates->has(true, application.pid(), AppStateMonitor::kRunningForeground); }));
    EXPECT_TRUE(becomes([&] { return monitor_.frontmostApplication() == kFirst; }));
    test::TestWindow helper(world_.display().name(), {.mapped = false});
    xcb_unmap_window(helper.connection(), number(application.window()));
    helper.sync();
    EXPECT_TRUE(becomes([&] { return updates->has(false, application.pid()); }));
    EXPECT_FALSE(updates->has(false, application.pid(), AppStateMonitor::kEnded));
    EXPECT_EQ(monitor_.frontmostApplication(), std::nullopt);
    xcb_map_window(helper.connection(), number(application.window()));
    helper.sync();
    EXPECT_TRUE(becomes([&] { return updates->count() == 3; })) << "and forth again";
}

TEST_F(X11AppState, AWindowManagerMayComeAndGo) {
    world_.openTwoApplications();
    const auto updates = listen();
    ASSERT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    {
        test::ChildProcess manager({"openbox", "--config-file", "/dev/null"}, -1,
                                   {"DISPLAY=" + world_.display().name()});
        waitForManager();
        activate(world_.second()->window(), kSecond, kFirst);
        EXPECT_TRUE(becomes([&] { return updates->has(true, world_.second()->pid()); }));
        activate(world_.first()->window(), kFirst, kSecond);
        manager.end(SIGKILL);
    }
    // Its properties are left over and say nothing any more; what is on top counts again.
    test::TestWindow own(world_.display().name(), {});
    EXPECT_TRUE(becomes([&] { return updates->has(true, ProcessID{::getpid()}); }));
    own.unmap();
    EXPECT_TRUE(becomes([&] { return monitor_.frontmostApplication().has_value(); }));
    world_.bringSecondToFront();
    EXPECT_TRUE(becomes([&] { return isInFront(monitor_, kSecond) && isBehind(monitor_, kFirst); }));
}

TEST_F(X11AppState, TheEndOfTheApplicationInFrontIsToldWithAWindowManagerToo) {
    const test::ChildProcess manager({"openbox", "--config-file", "/dev/null"}, -1,
                                     {"DISPLAY=" + world_.display().name()});
    waitForManager();
    world_.openTwoApplications();
    activate(world_.first()->window(), kFirst, kSecond);
    const auto updates = listen();
    ASSERT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    const ProcessID first = world_.first()->pid();
    world_.first().reset();
    EXPECT_TRUE(becomes([&] { return updates->has(false, first, AppStateMonitor::kEnded); }));
    EXPECT_TRUE(becomes([&] { return updates->has(true, world_.second()->pid()); })) << "the manager's choice";
    EXPECT_FALSE(updates->has(true, first)) << "it does not come back";
}

TEST(X11AppStateWithoutDisplay, AnswersZero) {
    const auto loop = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler(loop);
    RunningThreadLoop running(*loop);
    X11AppStateMonitor monitor(
        ":4711", scheduler, [](ProcessID) { return kFirst; },
        [](const BundleIdentifier&) { return std::vector<ProcessID>{ProcessID{1}}; });
    monitor.setHandler([](std::int64_t, bool, ProcessID) {});
    EXPECT_EQ(monitor.applicationState(kFirst), 0u);
}

TEST(X11AppStateNaming, AsksAllProcessesWhenNobodyKnowsThoseOfAnApplication) {
    const test::PrivateDisplay display;
    const test::XClientProcess application(display.name());
    const auto loop = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler(loop);
    RunningThreadLoop running(*loop);
    X11AppStateMonitor monitor(display.name(), scheduler, [&](ProcessID pid) {
        return pid == application.pid() ? std::optional(kFirst) : std::nullopt;
    });
    EXPECT_TRUE(becomes([&] { return isInFront(monitor, kFirst); }));
    EXPECT_EQ(monitor.applicationState(kSecond), 0u);
}

}  // namespace
}  // namespace lumacast
