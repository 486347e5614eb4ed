// Ends of recordings of the whole display that are rarely seen: without a client, or while the user is asked.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

using std::chrono::seconds;
using Response = UserAlert::Response;

class WholeDisplayEnds : public DaemonWorld {
protected:
    std::unique_ptr<TestClient> makeEntitled() {
        auto client = makeConnected("Control", 600, 60);
        fakes_.ipc.grant(client->pid, "com.orvane.private.luma-cast", true);
        return client;
    }
    TestClient::AskedRef started(TestClient& client, bool wholeDisplay) {
        fakes_.logSink.clear();
        auto asked = wholeDisplay ? client.start({}, {.system = true}) : client.start();
        settle();
        return asked;
    }
    std::unique_ptr<TestClient> makeWholeDisplay() {
        auto client = makeEntitled();
        EXPECT_EQ(started(*client, true)->code(), 0);
        return client;
    }
    void leave(TestClient& client) {
        client.connection->invalidate();
        settle();
    }
    std::size_t loggedTheMovie(const std::string& path) {
        return logged("nobody hears of the end of a recording of the whole display: its movie is " + path);
    }
    /// A dialog stands for this client's start.
    TestClient::AskedRef ask(TestClient& client) {
        fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", false);
        auto asked = started(client, false);
        EXPECT_EQ(fakes_.userAlerts.standing(), 1u);
        return asked;
    }
};

TEST_F(WholeDisplayEnds, TheMovieOfOneWithoutAClientStaysAndTheLogSaysWhere) {
    const auto client = makeWholeDisplay();
    advance(seconds(2));
    const std::string movie = session(*client)->movieWriter()->outputPath();
    leave(*client);
    fakes_.displayCapture.lastSource()->preempt();
    settle();
    EXPECT_EQ(loggedTheMovie(movie), 1u);
    EXPECT_TRUE(fakes_.fileSystem.exists(movie));
    EXPECT_TRUE(fakes_.photoLibrary.assets().empty());
}

TEST_F(WholeDisplayEnds, AClientThatIsThereIsToldAndTheLogNeedNotSay) {
    const auto client = makeWholeDisplay();
    const std::string movie = session(*client)->movieWriter()->outputPath();
    fakes_.displayCapture.lastSource()->preempt();
    settle();
    EXPECT_EQ(client->toldOfStop(-5806), 1);
    EXPECT_EQ(loggedTheMovie(movie), 0u);
}

TEST_F(WholeDisplayEnds, AReportWaitsForNoDialogAndKeepsNoSession) {
    auto client = makeWholeDisplay();
    const auto player = makeConnected();
    // Its own start takes the recording's place before the user is asked; the next one of the display begins meanwhile.
    ask(*player);
    fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
    ASSERT_EQ(started(*client, true)->code(), 0);
    const std::weak_ptr<LCRecordingSession> recorded = session(*client);
    fakes_.displayCapture.lastSource()->mediaServicesWereReset();
    settle();
    EXPECT_EQ(client->toldOfStop(-5817), 1);
    leave(*client);
    EXPECT_EQ(session(*client), nullptr);
    ASSERT_EQ(fakes_.userAlerts.standing(), 1u);
    EXPECT_TRUE(recorded.expired());
}

TEST_F(WholeDisplayEnds, OneThatBeganWhileTheUserWasAskedIsInterruptedLikeAnyOther) {
    fakes_.deviceInfo.setRegionalRule("RegionalBehaviorShutterClick", true);
    const auto player = makeConnected();
    const auto asked = ask(*player);
    fakes_.preferences.set(kPreferenceDomain, "LCSuppressAlert", true);
    const auto client = makeEntitled();
    ASSERT_EQ(started(*client, true)->code(), 0);
    const auto played = fakes_.systemSounds.played();
    advance(seconds(2));
    const auto recorded = session(*client);
    const std::string movie = recorded->movieWriter()->outputPath();
    ASSERT_TRUE(fakes_.userAlerts.answer(Response::DefaultButton));
    settle();
    EXPECT_EQ(asked->code(), 0);
    EXPECT_TRUE(session(*player)->isRecording());
    // Neither the library nor a sound, and no error: its client has the movie.
    EXPECT_FALSE(recorded->isRecording());
    EXPECT_EQ(logged("interrupted session"), 1u);
    EXPECT_TRUE(fakes_.photoLibrary.assets().empty());
    EXPECT_EQ(fakes_.systemSounds.played(), played);
    EXPECT_EQ(client->toldOfStop(-5806), 0);
    ASSERT_FALSE(client->told.empty());
    const auto* url = client->told.back().arguments[1].as<URL>();
    ASSERT_TRUE(url);
    EXPECT_EQ(url->path(), movie);
    EXPECT_TRUE(fakes_.fileSystem.exists(movie));
}

}  // namespace
}  // namespace lumacast
