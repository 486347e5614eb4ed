// Questions that never got as far as the screen: refused, but by nobody.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

class UnseenAlert : public DaemonWorld {
protected:
    UnseenAlert() { fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", false); }
};

TEST_F(UnseenAlert, IsARefusalThatTheLogDoesNotBlameOnTheUser) {
    const auto client = makeConnected();
    fakes_.logSink.clear();
    const auto asked = client->start({client->window});
    settle();
    ASSERT_TRUE(fakes_.userAlerts.failToShow());
    settle();
    EXPECT_EQ(asked->code(), -5801);
    EXPECT_EQ(logged("error showing acknowledgement alert"), 1u);
    EXPECT_EQ(logged("user refused recording"), 0u);
    EXPECT_EQ(logged("start request 1 refused with -5801: the user can't be asked"), 1u);
}

TEST_F(UnseenAlert, LeavesTheNextQuestionToTheUser) {
    const auto client = makeConnected();
    const auto asked = client->start({client->window}), askedAgain = client->start({client->window});
    settle();
    ASSERT_TRUE(fakes_.userAlerts.failToShow());
    settle();
    EXPECT_EQ(asked->code(), -5801);
    ASSERT_TRUE(fakes_.userAlerts.answer(UserAlert::Response::DefaultButton));
    settle();
    EXPECT_EQ(askedAgain->code(), 0);
}

}  // namespace
}  // namespace lumacast
