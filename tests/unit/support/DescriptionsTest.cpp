// What the device says about applications, recordings and the network.

#include <gtest/gtest.h>

#include <limits>

#include "support/LCReachability.h"
#include "support/LCStatusBarAssertion.h"
#include "support/LCStoreManager.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;

class Descriptions : public ::testing::Test {
protected:
    Descriptions() {
        FakeBundle framework;
        framework.path = fakes_.bundles.frameworkBundlePath();
        framework.tables["Localizable"] = {{"RECORDING_STATUS_BAR", "recording"},
                                           {"RECORDING_PAUSED_STATUS_BAR", "recording paused"},
                                           {"BROADCASTING_STATUS_BAR_FORMAT", "to %@"},
                                           {"BROADCASTING_PAUSED_STATUS_BAR_FORMAT", "to %@ paused"}};
        fakes_.bundles.install(std::move(framework));
    }
    ~Descriptions() override { world_.scheduler.endWorld(); }

    SimWorld world_{1};
    FakePlatform& fakes_ = world_.fakes;
    Localization localization_{fakes_.bundles};
};

class Store : public Descriptions {
protected:
    /// What the manager answers, and how often.
    LCStoreInfo infoOf(const std::string& identifier) {
        std::optional<LCStoreInfo> result;
        int calls = 0;
        bool wasOnMainQueue = false;
        const auto ask = [&] {
            store_.loadItemDetailsForBundleIdentifier(BundleIdentifier(identifier), [&](const LCStoreInfo& info) {
                ++calls;
                result = info;
                wasOnMainQueue = fakes_.scheduler.mainQueue().isCurrent();
            });
        };
        fakes_.scheduler.mainQueue().sync([&] {
            ask();
            EXPECT_EQ(calls, 0) << "posted, also on the main queue";
        });
        world_.scheduler.runUntilIdle();
        EXPECT_EQ(calls, 1);
        EXPECT_TRUE(wasOnMainQueue);
        return result.value_or(LCStoreInfo{});
    }

    LCStoreManager store_{fakes_.platform(), localization_};
};

TEST_F(Store, AProductFillsEveryEntry) {
    fakes_.storeLookup.add("org.example.Game", {"The Game", "Maker", "https://example.com/game", {{"A", "B"}}});
    const Dictionary entries = infoOf("org.example.Game").dictionary();
    EXPECT_EQ(entries, (Dictionary{{"LCStoreInfoBundleIDKey", "org.example.Game"},
                                   {"LCStoreInfoAppNameKey", "The Game"},
                                   {"LCStoreInfoAuthorKey", "Maker"},
                                   {"LCStoreInfoItemURLKey", "https://example.com/game"},
                                   {"LCStoreInfoCategoriesKey", "A,B"}}));
    const auto requests = fakes_.storeLookup.requests();
    ASSERT_EQ(requests.size(), 1u);
    EXPECT_EQ(requests[0].keyProfile, StoreRequest::KeyProfile::Product);
    EXPECT_EQ(requests[0].localizationStyle, 1);
    EXPECT_EQ(requests[0].bundleIdentifiers, std::vector<std::string>{"org.example.Game"});
}

TEST_F(Store, WhatIsNotFoundHasItsLocalNameAndEmptyTexts) {
    fakes_.bundles.installApplication(BundleIdentifier("org.example.Local"), "Local Name");
    EXPECT_EQ(infoOf("org.example.Local").dictionary(), (Dictionary{{"LCStoreInfoBundleIDKey", "org.example.Local"},
                                                                    {"LCStoreInfoAppNameKey", "Local Name"},
                                                                    {"LCStoreInfoAuthorKey", ""},
                                                                    {"LCStoreInfoItemURLKey", ""}}));
    EXPECT_EQ(infoOf("org.example.Nowhere").dictionary(),
              (Dictionary{{"LCStoreInfoBundleIDKey", "org.example.Nowhere"},
                          {"LCStoreInfoAuthorKey", ""},
                          {"LCStoreInfoItemURLKey", ""}}));
}

TEST_F(Store, AProductWithoutANameHasItsLocalOneAndNoCategoriesMeanNoEntry) {
    fakes_.bundles.installApplication(BundleIdentifier("org.example.Local"), "Local Name");
    fakes_.storeLookup.add("org.example.Local", {std::nullopt, "Maker", std::nullopt, std::vector<std::string>{}});
    const LCStoreInfo info = infoOf("org.example.Local");
    EXPECT_EQ(info.appName, "Local Name");
    EXPECT_EQ(info.author, "Maker");
    EXPECT_TRUE(info.categories) << "the store said that there are none";
    EXPECT_EQ(info.dictionary().find("LCStoreInfoCategoriesKey"), nullptr);
    EXPECT_EQ(LCStoreInfo{}.dictionary(), Dictionary{});
    LCStoreInfo one;
    one.categories = {"One"};
    EXPECT_EQ(one.dictionary(), (Dictionary{{"LCStoreInfoCategoriesKey", "One"}}));
}

TEST_F(Store, ALookupThatFailsIsAnsweredToo) {
    fakes_.storeLookup.add("org.example.Game", {"The Game", {}, {}, {}});
    fakes_.faults.failNext("StoreLookup.start");
    EXPECT_EQ(infoOf("org.example.Game").appName, std::nullopt);
}

TEST_F(Store, TheAnswerComesOnTheMainQueueAlsoToOtherLanes) {
    int calls = 0;
    bool wasOnMainQueue = false;
    const auto lane = fakes_.scheduler.serialQueue("asks");
    lane->async([&] {
        store_.loadItemDetailsForBundleIdentifier(BundleIdentifier("org.example.Game"), [&](const LCStoreInfo& info) {
            ++calls;
            EXPECT_EQ(info.bundleID, BundleIdentifier("org.example.Game"));
            wasOnMainQueue = fakes_.scheduler.mainQueue().isCurrent();
        });
        EXPECT_EQ(calls, 0);
    });
    world_.scheduler.runUntilIdle();
    EXPECT_EQ(calls, 1);
    EXPECT_TRUE(wasOnMainQueue);
}

class Network : public Descriptions {};

TEST_F(Network, IsAvailableWhenTheHostIsReachableWithoutAConnectionToBeBroughtUp) {
    const LCReachability reachability(fakes_.networkReachability);
    EXPECT_FALSE(reachability.isNetworkAvailable()) << "the flags can't be read";
    EXPECT_FALSE(fakes_.networkReachability.hostName().empty());
    for (std::uint32_t flags = 0; flags < 32; ++flags) {
        fakes_.networkReachability.setFlags(flags);
        EXPECT_EQ(reachability.isNetworkAvailable(), (flags & 2) != 0 && (flags & 4) == 0) << flags;
    }
    EXPECT_TRUE(fakes_.logSink.logged().empty());
}

/// Counts what the timer asks for.
class CountingAssertion final : public LCStatusBarAssertion {
public:
    using LCStatusBarAssertion::LCStatusBarAssertion;
    void updateStatusStringWithTimer() override {
        ++updates;
        if (main && !main->isCurrent()) ++elsewhere;
    }
    const SerialQueue* main = nullptr;
    int updates = 0, elsewhere = 0;
};

class StatusBar : public Descriptions {
protected:
    const std::shared_ptr<CountingAssertion> assertion_ =
        std::make_shared<CountingAssertion>(fakes_.platform(), localization_);
};

TEST_F(StatusBar, ElapsedTimeIsPaddedBelowAMinuteAndHasTwoUnitsFromThenOn) {
    const std::vector<std::pair<double, std::string>> texts{
        {0, "00:00"},      {5, "00:05"},      {59.9, "00:59"},  {59.999, "00:59"}, {60, "1:00"},
        {61, "1:01"},      {599, "9:59"},     {3599.9, "59:59"}, {3600, "1:00"},    {3661, "1:01"},
        {7325, "2:02"},    {86399, "23:59"},  {86400, "1:00"},   {90061, "1:01"},   {10 * 86400.0, "10:00"}};
    for (const auto& [seconds, text] : texts)
        EXPECT_EQ(LCStatusBarAssertion::stringWithTimeInterval(seconds), text) << seconds;
    EXPECT_EQ(LCStatusBarAssertion::stringWithTimeInterval(-1), "00:00");
    EXPECT_EQ(LCStatusBarAssertion::stringWithTimeInterval(std::numeric_limits<double>::quiet_NaN()), "00:00");
}

TEST_F(StatusBar, TheStateSaysWhetherItRecordsOrBroadcastsAndIsPaused) {
    EXPECT_EQ(assertion_->lcLocalizedRecordingDuration(5, false), "recording");
    EXPECT_EQ(assertion_->lcLocalizedRecordingDuration(500, true), "recording paused");
    assertion_->broadcasting = true;
    EXPECT_EQ(assertion_->lcLocalizedRecordingDuration(5, false), "to ") << "nobody has named the service";
    assertion_->broadcastServiceName = "100 %@ Live";
    EXPECT_EQ(assertion_->lcLocalizedRecordingDuration(5, false), "to 100 %@ Live");
    EXPECT_EQ(assertion_->lcLocalizedRecordingDuration(5, true), "to 100 %@ Live paused");
}

TEST_F(StatusBar, ThereIsOneTimerHoweverOftenItIsStarted) {
    assertion_->startRepeatingTimer();
    EXPECT_FALSE(assertion_->hasTimer()) << "posted to the main queue";
    world_.scheduler.runUntilIdle();
    ASSERT_TRUE(assertion_->hasTimer());
    world_.scheduler.advance(milliseconds(499));
    EXPECT_EQ(assertion_->updates, 0);
    world_.scheduler.advance(milliseconds(1));
    EXPECT_EQ(assertion_->updates, 1);
    const auto first = assertion_->timerStartDate();
    world_.scheduler.advance(milliseconds(250));
    assertion_->startRepeatingTimer();
    world_.scheduler.runUntilIdle();
    world_.scheduler.advance(milliseconds(499));
    EXPECT_EQ(assertion_->updates, 1) << "the first timer is gone";
    world_.scheduler.advance(milliseconds(501));
    EXPECT_EQ(assertion_->updates, 3);
    ASSERT_TRUE(first && assertion_->timerStartDate());
    EXPECT_NEAR(secondsBetween(*first, *assertion_->timerStartDate()), 0.75, 0.01);
}

TEST_F(StatusBar, ItsTimerIsTheMainQueuesWhoeverStartsIt) {
    assertion_->main = &fakes_.scheduler.mainQueue();
    const auto lane = fakes_.scheduler.serialQueue("starts");
    lane->async([&] {
        assertion_->startRepeatingTimer();
        EXPECT_FALSE(assertion_->hasTimer());
    });
    world_.scheduler.runUntilIdle();
    world_.scheduler.advance(std::chrono::seconds(2));
    EXPECT_EQ(assertion_->updates, 4);
    EXPECT_EQ(assertion_->elsewhere, 0);
}

TEST_F(StatusBar, ItOwnsNoneOfItsDelegatesAndShowsNothing) {
    class Delegate final : public LCStatusBarAssertionDelegate {};
    auto one = std::make_shared<Delegate>(), two = std::make_shared<Delegate>();
    assertion_->delegate = one;
    assertion_->assertionDelegate = two;
    EXPECT_EQ(one.use_count() + two.use_count(), 2);
    assertion_->showDoubleHeightStatusBarWithPid(ProcessID{500});
    assertion_->updateDoubleHeightStatusBarWithDuration(5, true);
    assertion_->invalidateDoubleHeightStatusBar();
    assertion_->LCStatusBarAssertion::updateStatusStringWithTimer();
    world_.scheduler.runUntilIdle();
    EXPECT_FALSE(assertion_->assertion || assertion_->coordinator || assertion_->hasTimer());
    EXPECT_FALSE(assertion_->paused);
    EXPECT_TRUE(fakes_.logSink.lines().empty());
}

TEST_F(StatusBar, ItsTimerEndsWithIt) {
    auto assertion = std::make_shared<CountingAssertion>(fakes_.platform(), localization_);
    const std::weak_ptr<CountingAssertion> weak = assertion;
    assertion->startRepeatingTimer();
    world_.scheduler.runUntilIdle();
    assertion.reset();
    EXPECT_TRUE(weak.expired());
    world_.scheduler.advance(std::chrono::seconds(5));
}

}  // namespace
}  // namespace lumacast
