// Alerts that are answered from within the process.

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <utility>

#include "headless/user/SyntheticUserAlerts.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/DialogWorld.h"
#include "tests/fakes/FakeUserAlerts.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

using Response = UserAlert::Response;

/// Does something when the last one lets go of it.
class AtTheEnd {
public:
    explicit AtTheEnd(std::function<void()> act) : act_(std::move(act)) {}
    ~AtTheEnd() { act_(); }
    AtTheEnd(const AtTheEnd&) = delete;
    AtTheEnd& operator=(const AtTheEnd&) = delete;

private:
    const std::function<void()> act_;
};

/// Answers while the oldest of two alerts is being destroyed, which lets go of its handler.
template <class Alerts>
void expectThatTheOtherOneIsAnswered(Alerts& alerts) {
    bool wasAnswered = false;
    auto oldest = alerts.show({});
    const auto other = alerts.show({});
    const test::Answer answer, tooLate;
    other->receiveResponse(answer.handler());
    oldest->receiveResponse([answering = std::make_shared<AtTheEnd>([&] {
                                 wasAnswered = alerts.answer(Response::DefaultButton);
                             }),
                             handler = tooLate.handler()](Response response) { handler(response); });
    oldest.reset();
    EXPECT_TRUE(wasAnswered);
    EXPECT_EQ(answer.wait(), Response::DefaultButton);
    EXPECT_EQ(tooLate.count(), 0u);
    EXPECT_EQ(alerts.standing(), 0u);
}

class StandingAlertsTest : public ::testing::Test {
protected:
    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
    FaultPlan faults_;
    FakeUserAlerts fake_{scheduler_, faults_};
    headless::SyntheticUserAlerts synthetic_{headless::Consent::Wait, scheduler_, [](const auto&, auto) {}};
};

TEST_F(StandingAlertsTest, OneThatIsJustBeingDestroyedIsNotTheOldestAnyMore) {
    expectThatTheOtherOneIsAnswered(fake_);
    expectThatTheOtherOneIsAnswered(synthetic_);
}

TEST_F(StandingAlertsTest, WithoutOneThereIsNothingToAnswer) {
    for (int round = 0; round < 2; ++round) {
        EXPECT_FALSE(fake_.answer(Response::DefaultButton));
        EXPECT_FALSE(fake_.failToShow());
        EXPECT_FALSE(synthetic_.answer(Response::DefaultButton));
        const auto one = fake_.show({}), other = synthetic_.show({});
        EXPECT_TRUE(fake_.answer(Response::DefaultButton));
        EXPECT_TRUE(synthetic_.answer(Response::DefaultButton));
    }
}

}  // namespace
}  // namespace lumacast
