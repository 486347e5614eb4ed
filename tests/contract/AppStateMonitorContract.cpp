#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "headless/display/SyntheticAppStateMonitor.h"
#include "tests/contract/AppStateWorld.h"
#include "tests/contract/Skip.h"
#include "tests/fakes/FakeAppStateMonitor.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;
using test::AppStateWorld;
using test::becomes;
using test::isBehind;
using test::isInFront;
using test::kFirst;
using test::kSecond;
using test::kUnknown;
using test::PortAppStateWorld;
using test::Updates;

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

using Maker = std::function<std::unique_ptr<AppStateWorld>()>;

class AppStateMonitorContract : public ::testing::TestWithParam<Maker> {
protected:
    const std::unique_ptr<AppStateWorld> world_ = GetParam()();
    AppStateMonitor& monitor_ = world_->monitor();

    std::string whyAllAreInFront() const { return world_->whyAllAreInFront(); }
    std::shared_ptr<Updates> listen() { return test::listenTo(*world_); }
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

}  // namespace
}  // namespace lumacast
