#include <gtest/gtest.h>

#include "headless/user/SyntheticUserAlerts.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/DialogWorld.h"
#include "tests/contract/Skip.h"
#include "tests/fakes/FakeUserAlerts.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

using Response = UserAlert::Response;
using test::Answer;
using test::threeButtons;
using test::twoButtons;

class UserAlertWorld {
public:
    virtual ~UserAlertWorld() = default;
    virtual UserAlerts& alerts() = 0;
    /// The user presses a button of the alert that stands there.
    virtual void press(Response button) = 0;
    virtual void dismiss() = 0;
    virtual std::size_t standing() = 0;
    /// From now on nothing can be shown.
    virtual void loseTheScreen() = 0;
    /// Why there is always something to show an alert on; empty where that can be lost.
    virtual std::string whyTheScreenStays() const { return {}; }
};

class FakeUserAlertWorld final : public UserAlertWorld {
public:
    UserAlerts& alerts() override { return alerts_; }
    void press(Response button) override { alerts_.answer(button); }
    void dismiss() override { alerts_.answer(Response::OtherButton); }
    std::size_t standing() override { return alerts_.standing(); }
    void loseTheScreen() override { faults_.failNext("UserAlerts.show", 1'000); }

private:
    const std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler_{loop_};
    FaultPlan faults_;
    FakeUserAlerts alerts_{scheduler_, faults_};
};

class PortUserAlertWorld final : public UserAlertWorld {
public:
    UserAlerts& alerts() override { return world_.alerts(); }
    void press(Response button) override {
        using Button = test::DialogUser::Button;
        const auto dialog = world_.user().waitForDialog();
        ASSERT_TRUE(dialog);
        ASSERT_TRUE(world_.user().click(*dialog, button == Response::DefaultButton     ? Button::Default
                                                 : button == Response::AlternateButton ? Button::Alternate
                                                                                       : Button::Other));
    }
    void dismiss() override {
        const auto dialog = world_.user().waitForDialog();
        ASSERT_TRUE(dialog);
        world_.user().close(*dialog);
    }
    std::size_t standing() override { return world_.user().dialogs().size(); }
    void loseTheScreen() override { world_.display().kill(); }

private:
    test::DialogWorld world_;
};

/// Alerts that are left standing, as this test's user takes the time that users take.
class HeadlessUserAlertWorld final : public UserAlertWorld {
public:
    UserAlerts& alerts() override { return alerts_; }
    void press(Response button) override { EXPECT_TRUE(alerts_.answer(button)); }
    void dismiss() override { press(Response::OtherButton); }
    std::size_t standing() override { return alerts_.standing(); }
    void loseTheScreen() override {}
    std::string whyTheScreenStays() const override { return "there is no screen that could be lost"; }

private:
    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
    headless::SyntheticUserAlerts alerts_{headless::Consent::Wait, scheduler_, [](const auto&, auto) {}};
};

using Maker = std::function<std::unique_ptr<UserAlertWorld>()>;

class UserAlertContract : public ::testing::TestWithParam<Maker> {
protected:
    std::optional<Response> answerTo(const AlertContent& content, Response pressed) {
        const auto alert = world_->alerts().show(content);
        if (!alert) return std::nullopt;
        const Answer answer;
        alert->receiveResponse(answer.handler());
        world_->press(pressed);
        return answer.wait();
    }

    std::unique_ptr<UserAlertWorld> world_ = GetParam()();
};

TEST_P(UserAlertContract, EachOfTwoButtonsAnswersItsOwn) {
    for (const Response button : {Response::DefaultButton, Response::OtherButton})
        EXPECT_EQ(answerTo(twoButtons(), button), button);
}

TEST_P(UserAlertContract, EachOfThreeButtonsAnswersItsOwn) {
    for (const Response button : {Response::DefaultButton, Response::AlternateButton, Response::OtherButton})
        EXPECT_EQ(answerTo(threeButtons(), button), button);
}

TEST_P(UserAlertContract, DismissingIsTheOtherButton) {
    const auto alert = world_->alerts().show(threeButtons());
    ASSERT_TRUE(alert);
    const Answer answer;
    alert->receiveResponse(answer.handler());
    world_->dismiss();
    EXPECT_EQ(answer.wait(), Response::OtherButton);
}

TEST_P(UserAlertContract, AnAlertStandsUntilItIsAnsweredAndIsGoneThen) {
    const auto alert = world_->alerts().show(twoButtons());
    ASSERT_TRUE(alert);
    EXPECT_TRUE(eventually([this] { return world_->standing() == 1; }));
    const Answer answer;
    alert->receiveResponse(answer.handler());
    EXPECT_EQ(answer.count(), 0u);
    world_->press(Response::DefaultButton);
    EXPECT_EQ(answer.wait(), Response::DefaultButton);
    EXPECT_TRUE(alert->wasShown());
    EXPECT_TRUE(eventually([this] { return world_->standing() == 0; }));
}

TEST_P(UserAlertContract, CancellingTakesTheAlertDownAsTheOtherButton) {
    const auto alert = world_->alerts().show(twoButtons());
    ASSERT_TRUE(alert);
    const Answer answer;
    alert->receiveResponse(answer.handler());
    EXPECT_TRUE(eventually([this] { return world_->standing() == 1; }));
    alert->cancel();
    EXPECT_EQ(answer.wait(), Response::OtherButton);
    EXPECT_TRUE(eventually([this] { return world_->standing() == 0; }));
    alert->cancel();
    EXPECT_EQ(answer.count(), 1u);
}

TEST_P(UserAlertContract, AnAlertThatIsDestroyedIsTakenDownAndAnswersNobody) {
    auto alert = world_->alerts().show(twoButtons());
    ASSERT_TRUE(alert);
    const Answer answer;
    alert->receiveResponse(answer.handler());
    EXPECT_TRUE(eventually([this] { return world_->standing() == 1; }));
    alert.reset();
    EXPECT_TRUE(eventually([this] { return world_->standing() == 0; }));
    EXPECT_TRUE(eventually([&] { return answer.handlerIsGone(); }));
    EXPECT_EQ(answer.count(), 0u);
}

TEST_P(UserAlertContract, AnAnswerThatCameBeforeItsHandlerIsKept) {
    const auto alert = world_->alerts().show(twoButtons());
    ASSERT_TRUE(alert);
    world_->press(Response::DefaultButton);
    EXPECT_TRUE(eventually([this] { return world_->standing() == 0; }));
    const Answer answer;
    alert->receiveResponse(answer.handler());
    EXPECT_EQ(answer.wait(), Response::DefaultButton);
}

TEST_P(UserAlertContract, TheHandlerIsCalledOnceFromAnotherLane) {
    const auto alert = world_->alerts().show(twoButtons());
    ASSERT_TRUE(alert);
    const Answer answer;
    alert->receiveResponse(answer.handler());
    alert->cancel();
    ASSERT_EQ(answer.wait(), Response::OtherButton);
    EXPECT_NE(answer.lane(), std::this_thread::get_id());
    EXPECT_TRUE(eventually([&] { return answer.handlerIsGone(); }));
    EXPECT_EQ(answer.count(), 1u);
}

TEST_P(UserAlertContract, AHandlerMayEndItsAlert) {
    auto alert = world_->alerts().show(twoButtons());
    ASSERT_TRUE(alert);
    const Answer answer;
    UserAlert& shown = *alert;
    shown.receiveResponse([alert = std::move(alert), told = answer.handler()](Response response) mutable {
        alert.reset();
        told(response);
    });
    world_->press(Response::DefaultButton);
    EXPECT_EQ(answer.wait(), Response::DefaultButton);
}

TEST_P(UserAlertContract, TwoAlertsAreTwo) {
    const auto first = world_->alerts().show(twoButtons());
    const auto second = world_->alerts().show(threeButtons());
    ASSERT_TRUE(first && second);
    EXPECT_TRUE(eventually([this] { return world_->standing() == 2; }));
    const Answer one, other;
    first->receiveResponse(one.handler());
    second->receiveResponse(other.handler());
    first->cancel();
    EXPECT_EQ(one.wait(), Response::OtherButton);
    EXPECT_TRUE(eventually([this] { return world_->standing() == 1; }));
    EXPECT_EQ(other.count(), 0u);
    world_->press(Response::AlternateButton);
    EXPECT_EQ(other.wait(), Response::AlternateButton);
}

TEST_P(UserAlertContract, WithoutAScreenThereIsNoAlert) {
    if (const std::string why = world_->whyTheScreenStays(); !why.empty()) LC_SKIP(why);
    world_->loseTheScreen();
    EXPECT_EQ(world_->alerts().show(twoButtons()), nullptr);
}

INSTANTIATE_TEST_SUITE_P(Fake, UserAlertContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeUserAlertWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, UserAlertContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortUserAlertWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Headless, UserAlertContract,
                         ::testing::Values(Maker([] { return std::make_unique<HeadlessUserAlertWorld>(); })));

TEST(SyntheticUserAlerts, AnswerEveryAlertAsConfigured) {
    ThreadScheduler scheduler(std::make_shared<ThreadLoop>());
    for (const auto& [consent, expected] : {std::pair{headless::Consent::Refuse, Response::OtherButton},
                                            {headless::Consent::Allow, Response::DefaultButton}}) {
        std::vector<std::optional<Response>> noted;
        headless::SyntheticUserAlerts alerts(consent, scheduler, [&](const AlertContent& content, auto response) {
            EXPECT_EQ(content.header, threeButtons().header);
            noted.push_back(response);
        });
        const auto alert = alerts.show(threeButtons());
        ASSERT_TRUE(alert);
        const Answer answer;
        alert->receiveResponse(answer.handler());
        EXPECT_EQ(answer.wait(), expected);
        EXPECT_TRUE(alert->wasShown());
        EXPECT_EQ(noted, std::vector{std::optional(expected)});
    }
}

TEST(SyntheticUserAlerts, TakeNoOtherWordForConsent) {
    EXPECT_EQ(headless::consentFrom("refuse"), headless::Consent::Refuse);
    EXPECT_EQ(headless::consentFrom("allow"), headless::Consent::Allow);
    EXPECT_EQ(headless::consentFrom("wait"), headless::Consent::Wait);
    for (const char* word : {"", "yes", "Allow", "allow ", "1"}) EXPECT_EQ(headless::consentFrom(word), std::nullopt) << word;
}

}  // namespace
}  // namespace lumacast
