// Whose recording it is that the user has in front.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

class Foreground : public DaemonWorld {
protected:
    /// The process whose sound belongs to the client's recording, and how often that was answered.
    std::vector<std::int32_t> soundOf(const TestClient& client) {
        std::vector<std::int32_t> answers;
        world_.scheduler.mainQueue().sync([&] {
            process_->manager().frontmostSession(*session(client),
                                                 [&](ProcessID pid) { answers.push_back(number(pid)); });
        });
        return answers;
    }
    using Answers = std::vector<std::int32_t>;
};

TEST_F(Foreground, OnlyTheBitOfTheForegroundCounts) {
    const auto client = makeConnected();
    for (const std::uint32_t state : {0u, 1u, 2u, 4u, 7u, 16u, ~8u}) {
        fakes_.appStateMonitor.setState(client->id, state);
        const auto refused = client->start();
        settle();
        EXPECT_EQ(refused->code(), -5803) << state;
    }
    for (const std::uint32_t state : {8u, 9u, ~0u}) {
        fakes_.appStateMonitor.setState(client->id, state);
        const auto started = client->start();
        settle();
        EXPECT_EQ(started->code(), 0) << state;
    }
}

TEST_F(Foreground, TheSoundOfAnApplicationsRecordingIsItsClientsOwnWhoeverIsInFront) {
    const auto client = makeConnected("Player", 500, 7), other = makeConnected("Editor", 501, 8);
    fakes_.appStateMonitor.setState(client->id, 4);
    fakes_.appStateMonitor.setProcess(other->id, other->pid);
    EXPECT_EQ(soundOf(*client), Answers{500});
    EXPECT_EQ(soundOf(*other), Answers{501});
}

TEST_F(Foreground, TheSoundOfASystemRecordingIsThatOfTheProcessInFront) {
    const auto client = makeConnected("Player", 500, 7), other = makeConnected("Editor", 501, 8);
    session(*client)->setSystemRecording(true);
    fakes_.appStateMonitor.setState(client->id, 4);
    fakes_.appStateMonitor.setProcess(client->id, client->pid);
    fakes_.appStateMonitor.setProcess(other->id, ProcessID{777});
    EXPECT_EQ(soundOf(*client), Answers{777});
}

TEST_F(Foreground, WithNothingInFrontASystemRecordingHasNoProcess) {
    const auto client = makeConnected();
    session(*client)->setSystemRecording(true);
    fakes_.appStateMonitor.setState(client->id, 4);
    EXPECT_EQ(soundOf(*client), Answers{-1});
    fakes_.appStateMonitor.setState(client->id, 8);
    EXPECT_EQ(soundOf(*client), Answers{-1}) << "nobody knows its process";
}

TEST_F(Foreground, ALostClientHasNoProcess) {
    const auto client = makeConnected();
    const auto kept = session(*client);
    kept->clientProxy()->setConnection(nullptr);
    EXPECT_EQ(soundOf(*client), Answers{-1});
}

}  // namespace
}  // namespace lumacast
