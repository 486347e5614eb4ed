// What a new layout of the display does to recordings.

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

/// A monitor whose layouts the test makes.
class TestLayoutMonitor final : public DisplayLayoutMonitor {
public:
    void addObserver(std::weak_ptr<DisplayLayoutObserver> observer) override { observer_ = std::move(observer); }
    void removeObserver(DisplayLayoutObserver& observer) override {
        if (observer_.lock().get() == &observer || observer_.expired()) observer_.reset();
        ++removals;
    }
    void invalidate() override { ++invalidations; }
    bool hasObserver() const { return !observer_.expired(); }

    int removals = 0, invalidations = 0;

private:
    std::weak_ptr<DisplayLayoutObserver> observer_;
};

class Layout : public DaemonWorld {
protected:
    /// The display shows elements with these levels from now on.
    void show(const std::vector<std::int64_t>& levels) {
        std::vector<DisplayLayoutElement> layout;
        for (const std::int64_t level : levels) layout.push_back({level});
        world_.scheduler.mainQueue().sync(
            [&] { process_->manager().layoutMonitorDidUpdateDisplayLayout(nullptr, layout); });
        settle();
    }
    bool isStillRecording(const TestClient& client) { return session(client)->isRecording(); }
};

TEST_F(Layout, GoingFromTwoElementsToOneStopsRecordingsBothTimes) {
    const auto client = makeRecording();
    advance(std::chrono::seconds(1));
    show({1, 1});
    EXPECT_FALSE(isStillRecording(*client));
    EXPECT_EQ(client->toldOfStop(-5807), 1);
    ASSERT_EQ(client->told.size(), 1u);
    const auto* url = client->told[0].arguments[1].as<URL>();
    ASSERT_TRUE(url) << "the movie up to then";
    EXPECT_EQ(url->path(), pathOf("Player"));
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    const auto again = client->start();
    settle();
    ASSERT_EQ(again->code(), 0);
    show({1});
    EXPECT_FALSE(isStillRecording(*client));
    EXPECT_EQ(client->toldOfStop(-5807), 2);
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(Layout, OneElementAfterAnotherChangesNothing) {
    const auto client = makeRecording();
    show({1});
    show({0});
    show({7});
    EXPECT_TRUE(isStillRecording(*client));
    EXPECT_TRUE(client->told.empty());
}

TEST_F(Layout, ElementsAboveKeepTheContentsSizeButAreNotCounted) {
    const auto client = makeRecording();
    show({0, 1, 2});
    EXPECT_TRUE(isStillRecording(*client));
    show({0});  // there were two low ones
    EXPECT_FALSE(isStillRecording(*client));
}

TEST_F(Layout, OneLowElementAmongOthersIsNotMoreThanOne) {
    const auto client = makeRecording();
    show({0, 2, 3});
    show({0});
    EXPECT_TRUE(isStillRecording(*client));
}

TEST_F(Layout, NoElementsAtAllCountAsResized) {
    const auto client = makeRecording();
    show({});
    EXPECT_FALSE(isStillRecording(*client));
    const auto again = client->start();
    settle();
    show({1});
    EXPECT_TRUE(isStillRecording(*client)) << "nothing was counted";
}

TEST_F(Layout, SystemRecordingsAndIdleSessionsAreLeftAlone) {
    const auto client = makeRecording(), idle = makeConnected("Editor", 501, 8);
    session(*client)->setSystemRecording(true);
    show({1, 1});
    EXPECT_TRUE(isStillRecording(*client));
    EXPECT_TRUE(client->told.empty());
    EXPECT_TRUE(idle->told.empty());
}

TEST_F(Layout, TheStopIsNotTheStopProcedure) {
    const auto client = makeRecording();
    show({1, 1});
    EXPECT_EQ(logged("LCRecordingManager: stopRecordingSession:handler:"), 0u);
    EXPECT_EQ(logged("LCRecordingSession: finishSessionWithHandler"), 1u);
    EXPECT_EQ(logged("LCRecordingManager:recordingSessionStoppedWithError:movieURL:"), 1u);
}

TEST_F(Layout, TheClientIsToldBeforeTheStateIsReset) {
    const auto client = makeRecording();
    show({1, 1});
    const Lines lines = fakes_.logSink.logged();
    ASSERT_GE(lines.size(), 3u);
    EXPECT_EQ(Lines(lines.end() - 3, lines.end()),
              (Lines{"LCRecordingManager:recordingSessionStoppedWithError:movieURL:",
                     "LCClientProxy:stopRecordingWithError:movieURL:", "LCRecordingManager:resetStatesForSession:"}));
}

TEST_F(Layout, LevelsBelowNothingCountAsLow) {
    const auto client = makeRecording();
    show({-1, 1, 2});
    EXPECT_TRUE(isStillRecording(*client));
    show({0});
    EXPECT_FALSE(isStillRecording(*client));
}

TEST_F(Layout, ElementsAboveAloneAreNotCounted) {
    const auto client = makeRecording();
    show({2, 2});
    show({1});
    EXPECT_TRUE(isStillRecording(*client));
}

TEST_F(Layout, OneElementCountsAsAReturnOnlyOnce) {
    const auto client = makeRecording();
    show({0, 1, 2});
    show({0});
    ASSERT_FALSE(isStillRecording(*client));
    client->start();
    settle();
    show({0});
    EXPECT_TRUE(isStillRecording(*client));
}

TEST_F(Layout, APausedRecordingIsStoppedWithItsMovie) {
    const auto client = makeRecording();
    advance(std::chrono::seconds(1));
    client->tell(DaemonMessage::PauseRecording);
    settle();
    ASSERT_TRUE(session(*client)->isPaused());
    show({1, 1});
    EXPECT_FALSE(isStillRecording(*client));
    EXPECT_FALSE(session(*client)->isPaused());
    EXPECT_EQ(client->toldOfStop(-5807), 1);
    ASSERT_EQ(client->told.size(), 1u);
    EXPECT_TRUE(client->told[0].arguments[1].as<URL>());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
}

TEST_F(Layout, ARecordingThatHasNotBegunYetIsStoppedAndItsStartAnswered) {
    const auto client = makeConnected();
    const auto goOn = std::shared_ptr<Semaphore>(world_.scheduler.semaphore(0));
    fakes_.containerWriters.setWhenMade([goOn] { goOn->wait(); });
    const auto asked = client->start();
    settle();
    ASSERT_TRUE(isStillRecording(*client));
    ASSERT_EQ(asked->answers, 0) << "the writer is being made";
    show({1, 1});
    fakes_.containerWriters.setWhenMade({});
    goOn->signal();
    settle();
    EXPECT_EQ(asked->answers, 1);
    EXPECT_FALSE(isStillRecording(*client));
    EXPECT_EQ(client->toldOfStop(-5807), 1);
    EXPECT_FALSE(fakes_.displayCapture.lastSource() && fakes_.displayCapture.lastSource()->isRunning());
    EXPECT_EQ(fakes_.keepAlive.open(), 0);
    const auto again = client->start();
    settle();
    EXPECT_EQ(again->code(), 0);
}

TEST_F(Layout, AMonitorIsObservedUntilAStop) {
    const auto monitor = std::make_shared<TestLayoutMonitor>();
    const auto client = makeRecording();
    world_.scheduler.mainQueue().sync([&] { process_->manager().setLayoutMonitor(monitor); });
    EXPECT_TRUE(monitor->hasObserver());
    client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_FALSE(monitor->hasObserver());
    EXPECT_EQ(monitor->removals, 1);
    client->ask(DaemonMessage::StopRecording);  // idle
    settle();
    EXPECT_EQ(monitor->removals, 1);
}

TEST(LayoutAtTheEnd, TheMonitorIsLetGoOf) {
    const auto monitor = std::make_shared<TestLayoutMonitor>();
    {
        SimWorld world(1);
        Process process(world.fakes.platform());
        world.scheduler.mainQueue().sync([&] { process.manager().setLayoutMonitor(monitor); });
        world.scheduler.endWorld();
    }
    EXPECT_EQ(monitor->removals, 1);
    EXPECT_EQ(monitor->invalidations, 1);
}

}  // namespace
}  // namespace lumacast
