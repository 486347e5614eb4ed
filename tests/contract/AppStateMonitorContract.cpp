#include <gtest/gtest.h>

#include <functional>
#include <map>
#include <memory>
#include <mutex>

#include "headless/display/SyntheticAppStateMonitor.h"
#include "linux/display/X11AppStateMonitor.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/Skip.h"
#include "tests/contract/TestWindow.h"
#include "tests/contract/XClientProcess.h"
#include "tests/fakes/FakeAppStateMonitor.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;
using Applications = std::map<BundleIdentifier, std::vector<ProcessID>>;

const BundleIdentifier kFirst("org.example.First"), kSecond("org.example.Second"), kTool("org.example.Tool"),
    kUnknown("org.example.Unknown");

/// What was told, and on which lane.
class Updates {
public:
    struct Update {
        std::int64_t state;
        bool frontmost;
        ProcessID pid;
    };
    void add(Update update, bool onMainQueue) {
        const std::lock_guard lock(mutex_);
        updates_.push_back(update);
        alwaysOnMainQueue_ &= onMainQueue;
    }
    bool has(bool frontmost, ProcessID pid, std::optional<std::int64_t> state = {}) const {
        const std::lock_guard lock(mutex_);
        for (const Update& update : updates_)
            if (update.frontmost == frontmost && update.pid == pid && (!state || update.state == *state)) return true;
        return false;
    }
    bool alwaysOnMainQueue() const { return alwaysOnMainQueue_; }
    std::size_t count() const {
        const std::lock_guard lock(mutex_);
        return updates_.size();
    }

private:
    mutable std::mutex mutex_;
    std::vector<Update> updates_;
    bool alwaysOnMainQueue_ = true;
};

class AppStateWorld {
public:
    virtual ~AppStateWorld() = default;
    virtual AppStateMonitor& monitor() = 0;
    /// Two applications with a window each; the first one is in front.
    virtual void openTwoApplications() = 0;
    virtual void bringSecondToFront() = 0;
    virtual ProcessID process(const BundleIdentifier& identifier) = 0;
    virtual void stopAnswering() = 0;
    /// Why all applications are in front here, and stay there; empty where one is.
    virtual std::string whyAllAreInFront() const { return {}; }

    SerialQueue& mainQueue() { return *loop_; }

protected:
    const std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler_{loop_};
    RunningThreadLoop running_{*loop_};
};

class FakeAppStateWorld final : public AppStateWorld {
public:
    AppStateMonitor& monitor() override { return monitor_; }
    void openTwoApplications() override {
        monitor_.setState(kFirst, AppStateMonitor::kRunningForeground);
        monitor_.setState(kSecond, 2);
        monitor_.setProcess(kFirst, process(kFirst));
        monitor_.setProcess(kSecond, process(kSecond));
    }
    void bringSecondToFront() override {
        monitor_.setState(kFirst, 2);
        monitor_.setState(kSecond, AppStateMonitor::kRunningForeground);
        monitor_.update(2, false, process(kFirst));
        monitor_.update(AppStateMonitor::kRunningForeground, true, process(kSecond));
    }
    ProcessID process(const BundleIdentifier& identifier) override { return ProcessID{identifier == kFirst ? 11 : 22}; }
    void stopAnswering() override {
        for (const char* call : {"applicationState", "frontmostApplication", "applicationProcess"})
            faults_.failNext(std::string("AppStateMonitor.") + call, 1000);
    }

private:
    FaultPlan faults_;
    FakeAppStateMonitor monitor_{scheduler_, faults_};
};

/// The port on a private display, with applications that are processes of their own.
class PortAppStateWorld : public AppStateWorld {
public:
    AppStateMonitor& monitor() override { return monitor_; }
    void openTwoApplications() override {
        second_ = std::make_unique<test::XClientProcess>(display_.name());
        first_ = std::make_unique<test::XClientProcess>(display_.name());
        const std::lock_guard lock(naming_->mutex);
        naming_->applications = {{kFirst, {first_->pid()}}, {kSecond, {second_->pid()}}, {kTool, {first_->tool()}}};
    }
    void bringSecondToFront() override {
        test::TestWindow helper(display_.name(), {.mapped = false});
        const std::uint32_t above = XCB_STACK_MODE_ABOVE;
        xcb_configure_window(helper.connection(), number(second_->window()), XCB_CONFIG_WINDOW_STACK_MODE, &above);
        helper.sync();
    }
    ProcessID process(const BundleIdentifier& identifier) override {
        return identifier == kFirst ? first_->pid() : second_->pid();
    }
    void stopAnswering() override { display_.hang(); }

    test::PrivateDisplay& display() { return display_; }
    std::unique_ptr<test::XClientProcess>& first() { return first_; }
    std::unique_ptr<test::XClientProcess>& second() { return second_; }
    void name(const BundleIdentifier& identifier, std::vector<ProcessID> processes) {
        const std::lock_guard lock(naming_->mutex);
        naming_->applications[identifier] = std::move(processes);
    }

private:
    struct Naming {
        std::mutex mutex;
        Applications applications;
    };
    const std::shared_ptr<Naming> naming_ = std::make_shared<Naming>();
    test::PrivateDisplay display_;
    std::unique_ptr<test::XClientProcess> first_, second_;
    X11AppStateMonitor monitor_{
        display_.name(), scheduler_,
        [naming = naming_](ProcessID pid) -> std::optional<BundleIdentifier> {
            const std::lock_guard lock(naming->mutex);
            for (const auto& [identifier, processes] : naming->applications)
                if (std::find(processes.begin(), processes.end(), pid) != processes.end()) return identifier;
            return std::nullopt;
        },
        [naming = naming_](const BundleIdentifier& identifier) {
            const std::lock_guard lock(naming->mutex);
            const auto found = naming->applications.find(identifier);
            return found == naming->applications.end() ? std::vector<ProcessID>{} : found->second;
        }};
};

/// Processes without a window between them.
class HeadlessAppStateWorld final : public AppStateWorld {
public:
    AppStateMonitor& monitor() override { return monitor_; }
    void openTwoApplications() override {
        for (auto* const one : {&first_, &second_})
            *one = std::make_unique<test::ChildProcess>(std::vector<std::string>{"sleep", "1000"});
    }
    void bringSecondToFront() override {}
    ProcessID process(const BundleIdentifier& identifier) override {
        const auto& process = identifier == kFirst ? first_ : second_;
        return ProcessID{process ? process->pid() : 0};
    }
    void stopAnswering() override {}
    std::string whyAllAreInFront() const override { return "every application is in front, and nobody can hang"; }

private:
    std::unique_ptr<test::ChildProcess> first_, second_;
    static bool isKnown(const BundleIdentifier& identifier) { return identifier == kFirst || identifier == kSecond; }
    std::optional<BundleIdentifier> applicationOf(ProcessID pid) {
        for (const BundleIdentifier& identifier : {kFirst, kSecond})
            if (process(identifier) == pid) return identifier;
        return std::nullopt;
    }

    headless::SyntheticAppStateMonitor monitor_{isKnown, [this](ProcessID pid) { return applicationOf(pid); }};
};

bool becomes(const std::function<bool()>& condition) {
    const auto limit = std::chrono::steady_clock::now() + 20s;
    while (!condition())
        if (std::chrono::steady_clock::now() > limit) return false;
    return true;
}

bool isInFront(AppStateMonitor& monitor, const BundleIdentifier& identifier) {
    return (monitor.applicationState(identifier) & AppStateMonitor::kRunningForeground) != 0;
}

/// Known, and not in front.
bool isBehind(AppStateMonitor& monitor, const BundleIdentifier& identifier) {
    const std::uint32_t state = monitor.applicationState(identifier);
    return state != 0 && (state & AppStateMonitor::kRunningForeground) == 0;
}

using Maker = std::function<std::unique_ptr<AppStateWorld>()>;

class AppStateMonitorContract : public ::testing::TestWithParam<Maker> {
protected:
    const std::unique_ptr<AppStateWorld> world_ = GetParam()();
    AppStateMonitor& monitor_ = world_->monitor();

    std::string whyAllAreInFront() const { return world_->whyAllAreInFront(); }
    std::shared_ptr<Updates> listen() {
        auto updates = std::make_shared<Updates>();
        SerialQueue& queue = world_->mainQueue();
        monitor_.setHandler([updates, &queue](std::int64_t state, bool frontmost, ProcessID pid) {
            updates->add({state, frontmost, pid}, queue.isCurrent());
        });
        return updates;
    }
};

TEST_P(AppStateMonitorContract, AnswersZeroForAnUnknownApplication) {
    world_->openTwoApplications();
    ASSERT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    EXPECT_EQ(monitor_.applicationState(kUnknown), 0u);
}

TEST_P(AppStateMonitorContract, TellsThatAnApplicationIsInFrontAndWhichProcessItIs) {
    world_->openTwoApplications();
    EXPECT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    EXPECT_TRUE(becomes([&] { return monitor_.applicationProcess(kSecond) == world_->process(kSecond); }));
    EXPECT_EQ(monitor_.applicationProcess(kUnknown), std::nullopt);
    if (!whyAllAreInFront().empty()) {
        EXPECT_TRUE(becomes([&] { return isInFront(monitor_, kSecond); }));
    }
}

TEST_P(AppStateMonitorContract, TellsWhichApplicationIsInFront) {
    if (!whyAllAreInFront().empty()) LC_SKIP(whyAllAreInFront());
    world_->openTwoApplications();
    EXPECT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    EXPECT_TRUE(becomes([&] { return isBehind(monitor_, kSecond); }));
    world_->bringSecondToFront();
    EXPECT_TRUE(becomes([&] { return isInFront(monitor_, kSecond); }));
    EXPECT_TRUE(becomes([&] { return isBehind(monitor_, kFirst); }));
}

TEST_P(AppStateMonitorContract, NamesTheApplicationInFrontAndTheProcessesOfBoth) {
    if (!whyAllAreInFront().empty()) LC_SKIP(whyAllAreInFront());
    world_->openTwoApplications();
    EXPECT_TRUE(becomes([&] { return monitor_.frontmostApplication() == kFirst; }));
    EXPECT_EQ(monitor_.applicationProcess(kFirst), world_->process(kFirst));
    EXPECT_EQ(monitor_.applicationProcess(kSecond), world_->process(kSecond));
    EXPECT_EQ(monitor_.applicationProcess(kUnknown), std::nullopt);
    world_->bringSecondToFront();
    EXPECT_TRUE(becomes([&] { return monitor_.frontmostApplication() == kSecond; }));
}

TEST_P(AppStateMonitorContract, TellsTheHandlerOnTheMainQueueWhenAnotherApplicationComesToFront) {
    if (!whyAllAreInFront().empty()) LC_SKIP(whyAllAreInFront());
    world_->openTwoApplications();
    const auto updates = listen();
    ASSERT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    EXPECT_EQ(updates->count(), 0u) << "nothing has changed yet";
    world_->bringSecondToFront();
    EXPECT_TRUE(becomes([&] { return updates->has(true, world_->process(kSecond)); }));
    EXPECT_TRUE(becomes([&] { return updates->has(false, world_->process(kFirst)); }));
    EXPECT_FALSE(updates->has(false, world_->process(kFirst), 1)) << "1 says that it has ended";
    EXPECT_TRUE(updates->alwaysOnMainQueue());
}

TEST_P(AppStateMonitorContract, TellsNobodyAfterAnEmptyHandler) {
    if (!whyAllAreInFront().empty()) LC_SKIP(whyAllAreInFront());
    world_->openTwoApplications();
    const auto updates = listen();
    ASSERT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    monitor_.setHandler({});
    world_->bringSecondToFront();
    ASSERT_TRUE(becomes([&] { return isInFront(monitor_, kSecond); }));
    world_->mainQueue().sync([] {});
    EXPECT_EQ(updates->count(), 0u);
}

TEST_P(AppStateMonitorContract, AnswersZeroInTimeWhenTheDesktopHangs) {
    if (!whyAllAreInFront().empty()) LC_SKIP(whyAllAreInFront());
    world_->openTwoApplications();
    ASSERT_TRUE(becomes([&] { return isInFront(monitor_, kFirst); }));
    world_->stopAnswering();
    const auto began = std::chrono::steady_clock::now();
    for (int question = 0; question < 5; ++question) EXPECT_EQ(monitor_.applicationState(kFirst), 0u);
    EXPECT_EQ(monitor_.frontmostApplication(), std::nullopt);
    EXPECT_EQ(monitor_.applicationProcess(kFirst), std::nullopt);
    EXPECT_LT(std::chrono::steady_clock::now() - began, 2s);
}

INSTANTIATE_TEST_SUITE_P(Fake, AppStateMonitorContract,
                         ::testing::Values([] { return std::make_unique<FakeAppStateWorld>(); }));
INSTANTIATE_TEST_SUITE_P(Port, AppStateMonitorContract,
                         ::testing::Values([] { return std::make_unique<PortAppStateWorld>(); }));
INSTANTIATE_TEST_SUITE_P(Headless, AppStateMonitorContract,
                         ::testing::Values([] { return std::make_unique<HeadlessAppStateWorld>(); }));

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
    std::shared_ptr<Updates> listen() {
        auto updates = std::make_shared<Updates>();
        SerialQueue& queue = world_.mainQueue();
        monitor_.setHandler([updates, &queue](std::int64_t state, bool frontmost, ProcessID pid) {
            updates->add({state, frontmost, pid}, queue.isCurrent());
        });
        return updates;
    }
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
    const auto updates = std::make_shared<Updates>();
    SerialQueue& queue = world_.mainQueue();
    monitor_.setHandler([updates, &queue](std::int64_t state, bool frontmost, ProcessID pid) {
        updates->add({state, frontmost, pid}, queue.isCurrent());
    });
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
    const auto updates = std::make_shared<Updates>();
    SerialQueue& queue = world_.mainQueue();
    monitor_.setHandler([updates, &queue](std::int64_t state, bool frontmost, ProcessID pid) {
        updates->add({state, frontmost, pid}, queue.isCurrent());
    });
    // Again and again: a request for a window that the manager has not taken note of yet is lost.
    const auto comesToFront = [&](ContextID window, const BundleIdentifier& front, const BundleIdentifier& behind) {
        return becomes([&] {
            const test::ChildProcess command({"xdotool", "windowactivate", std::to_string(number(window))}, -1,
                                             {"DISPLAY=" + world_.display().name()});
            becomes([&] { return command.ended(); });
            return isInFront(monitor_, front) && isBehind(monitor_, behind);
        });
    };
    EXPECT_TRUE(comesToFront(world_.second()->window(), kSecond, kFirst));
    EXPECT_TRUE(comesToFront(world_.first()->window(), kFirst, kSecond));
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
