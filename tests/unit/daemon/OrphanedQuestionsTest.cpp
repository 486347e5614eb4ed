// Questions to the user whose client goes while they are asked, shown, answered or waited for.

#include "base/Limits.h"
#include "tests/unit/daemon/AcknowledgementWorld.h"

namespace lumacast {
namespace {

class OrphanedQuestions : public AcknowledgementWorld {
protected:
    /// Keeps a lane busy until it is let go of.
    class Hold {
    public:
        Hold(Scheduler& scheduler, SerialQueue& lane) : goOn_(scheduler.semaphore(0)) {
            lane.async([goOn = goOn_] { goOn->wait(); });
        }
        void letGo() { goOn_->signal(); }

    private:
        const std::shared_ptr<Semaphore> goOn_;
    };
    void lose(TestClient& client) {
        client.connection.reset();
        client.die();
        settle();
    }
};

TEST_F(OrphanedQuestions, AnAnswerThatIsUnderWayWhenTheClientConnectsAnewCountsForNothing) {
    const auto client = makeConnected();
    const auto asked = started(*client);
    ASSERT_EQ(fakes_.userAlerts.standing(), 1u);
    Hold hold(fakes_.scheduler, world_.scheduler.mainQueue());
    settle();
    client->connect();
    settle();
    answer(Response::DefaultButton);  // stands behind the connection
    hold.letGo();
    settle();
    EXPECT_EQ(logged("user acknowledged recording, but microphone recording is disabled"), 0u);
    EXPECT_FALSE(isExempt(*client));
    EXPECT_FALSE(session(*client)->isRecording());
    EXPECT_EQ(fakes_.keepAlive.begun(), 0);
    EXPECT_EQ(asked->answers, 0) << "there is nobody to answer";
}

TEST_F(OrphanedQuestions, TheWaitingStartsOfAClientThatConnectsAnewMakeRoomForItsNextOnes) {
    const auto first = makeConnected("Player", 500, 7), second = makeConnected("Editor", 501, 8);
    started(*first);
    for (std::uint64_t i = 0; i < limitOf(Limit::StartsOfApplicationWaitingForUser); ++i)
        ASSERT_EQ(started(*second)->answers, 0);
    ASSERT_EQ(started(*second)->code(), -5803) << "too many wait";
    second->connect();
    settle();
    EXPECT_EQ(fakes_.userAlerts.standing(), 1u) << "the first one's";
    const auto again = started(*second);
    EXPECT_EQ(again->answers, 0) << "it waits";
    answer(Response::OtherButton);
    ASSERT_EQ(shown().size(), 2u);
    EXPECT_EQ(shown().back().application, second->id);
    answer(Response::DefaultButton);
    EXPECT_EQ(again->answers, 1);
    EXPECT_EQ(again->code(), 0);
    EXPECT_EQ(shown().size(), 2u);
}

TEST_F(OrphanedQuestions, TheAlertOfOneThatHasRecordedTheDisplayBeforeIsTakenDownWithItsClient) {
    const auto client = makeConnected();
    fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", true);
    fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
    ASSERT_EQ(started(*client, {.system = true})->code(), 0);
    client->ask(DaemonMessage::StopRecording);
    settle();
    fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", false);
    started(*client, {.system = true});
    ASSERT_EQ(fakes_.userAlerts.standing(), 1u);
    const auto kept = session(*client);
    ASSERT_TRUE(kept->isSystemRecording() && !kept->isRecording());
    lose(*client);
    EXPECT_EQ(fakes_.userAlerts.standing(), 0u);
    EXPECT_EQ(session(*client), kept) << "its session deliberately stays";
    EXPECT_FALSE(kept->isRecording());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    // It takes another one's start to be asked about.
    const auto player = makeConnected("Player", 501, 8);
    started(*player);
    EXPECT_EQ(fakes_.userAlerts.standing(), 1u);
}

TEST_F(OrphanedQuestions, WhatIsNotShownYetIsNotShownAtAll) {
    const auto client = makeConnected();
    Hold hold(fakes_.scheduler, process_->manager().lumaAlertQueue());
    started(*client);
    EXPECT_TRUE(shown().empty());
    lose(*client);
    hold.letGo();
    settle();
    EXPECT_TRUE(shown().empty());
    EXPECT_EQ(fakes_.keepAlive.begun(), 0);
}

TEST_F(OrphanedQuestions, WhatIsBeingShownMeanwhileIsTakenDown) {
    const auto client = makeConnected();
    std::size_t whileShowing = 0;
    fakes_.userAlerts.setWhenShowing([&] {
        client->connection.reset();
        client->die();
        (void)fakes_.scheduler.semaphore(0)->waitFor(std::chrono::seconds(1));  // the client has gone by then
        whileShowing = fakes_.userAlerts.standing();
    });
    started(*client);
    advance(std::chrono::seconds(2));
    ASSERT_FALSE(session(*client)) << "the client has gone";
    EXPECT_EQ(whileShowing, 1u);
    EXPECT_EQ(fakes_.userAlerts.standing(), 0u);
    // The next one's turn has come.
    fakes_.userAlerts.setWhenShowing({});
    const auto player = makeConnected("Editor", 501, 8);
    const auto asked = started(*player);
    answer(Response::DefaultButton);
    EXPECT_EQ(asked->code(), 0);
}

}  // namespace
}  // namespace lumacast
