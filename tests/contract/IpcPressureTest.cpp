// Peers that are slow, greedy or gone: they cost the others nothing.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/wait.h>

#include <algorithm>
#include <atomic>
#include <condition_variable>
#include <ctime>
#include <mutex>
#include <thread>

#include "tests/contract/IpcHostileWorld.h"

namespace lumacast {
namespace {

using ::testing::HasSubstr;

TEST_F(IpcHostileTest, ThousandUnfinishedMessagesCostNothing) {
    std::vector<RawPeer> peers;
    const Data frame = message(DaemonMessage::SetMicrophoneEnabled, {true}, 1);
    for (int i = 0; i < 1000; ++i) {
        ASSERT_TRUE(peers.emplace_back(path()).hello());
        ASSERT_TRUE(peers.back().send(Bytes(frame).first(25)));
        if (i % 100 == 0) { ASSERT_TRUE(isServed()); }
    }
    expectHello(peers.back());
    ASSERT_TRUE(isServed());

    // Nobody says anything for a while of the reactor's own timer: it must not be busy meanwhile.
    const auto busyTime = [&] {
        timespec time{};
        daemon->reactor.sync([&] { clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time); });
        return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
    };
    Shared<bool> isOver;
    const auto before = busyTime();
    const auto timer = daemon->reactor.after(std::chrono::milliseconds(200), [&] { isOver.set(true); });
    std::mutex mutex;
    std::unique_lock lock(mutex);
    std::condition_variable never;
    while (!isOver.get()) never.wait_for(lock, std::chrono::milliseconds(20));
    EXPECT_LT(busyTime() - before, std::chrono::milliseconds(20));
}

TEST_F(IpcHostileTest, ATruncatedPeerWhoseConnectionWasNotResumedKeepsNobodyBusy) {
    TearDown();
    start({});
    std::shared_ptr<IpcConnection> kept;
    const auto lazy = std::make_shared<RecordingDelegate>([&](const auto& connection) {
        kept = connection;
        return true;
    });
    ASSERT_TRUE(isServed());
    listener->setDelegate(lazy);
    {
        RawPeer peer(path());
        ASSERT_TRUE(peer.hello());
        ASSERT_TRUE(until([&] { return lazy->accepted.get().size() == 1; }));
    }
    timespec before{}, after{};
    daemon->reactor.sync([&] { clock_gettime(CLOCK_THREAD_CPUTIME_ID, &before); });
    for (int i = 0; i < 100; ++i) ASSERT_TRUE(isServed());
    daemon->reactor.sync([&] { clock_gettime(CLOCK_THREAD_CPUTIME_ID, &after); });
    LossRecorder loss;
    daemon->reactor.sync([&] {
        loss.watch(*kept);
        kept->resume();
    });
    EXPECT_TRUE(until([&] { return loss.invalidations.get() == 1; })) << "the loss is reported after the resume";
    daemon->reactor.sync([&] { kept.reset(); });
}

TEST_F(IpcHostileTest, AFloodOfMessagesKeepsNeitherTasksNorOtherPeersWaiting) {
    std::atomic<bool> stop{false};
    std::thread flood([&] {
        RawPeer peer(path());
        peer.hello();
        std::uint64_t sequence = 0;
        while (!stop) {
            Data many;
            for (int i = 0; i < 500; ++i) {
                const Data one = message(DaemonMessage::PauseRecording, {}, ++sequence);
                many.insert(many.end(), one.begin(), one.end());
            }
            if (!peer.send(many)) break;
        }
    });
    object->onMessage.set([&](const auto&, const IpcReply& reply) {
        object->received.change([](auto& list) { list.clear(); });
        if (reply) reply({Value()});
    });
    EXPECT_TRUE(until([&] { return delegate->accepted.get().size() == 2; }));
    std::vector<std::chrono::nanoseconds> waits;
    for (int i = 0; i < 100; ++i) {
        const auto begin = std::chrono::steady_clock::now();
        EXPECT_TRUE(isServed());
        daemon->reactor.sync([] {});
        waits.push_back(std::chrono::steady_clock::now() - begin);
    }
    stop = true;
    // Let the flooder's write go on to its end.
    friendly->invalidate();
    flood.join();
    std::sort(waits.begin(), waits.end());
    EXPECT_LT(waits[waits.size() / 2], std::chrono::milliseconds(100));
}

TEST_F(IpcHostileTest, AFloodOfTasksKeepsNoPeerWaiting) {
    std::atomic<bool> stop{false};
    std::atomic<std::uint64_t> ran{0};
    std::function<void()> again = [&] {
        ++ran;
        if (!stop) daemon->reactor.async(again);
    };
    // More at a time than one turn runs, each of which submits itself again.
    for (int i = 0; i < 1000; ++i) daemon->reactor.async(again);
    for (int i = 0; i < 20; ++i) EXPECT_TRUE(isServed());
    EXPECT_GT(ran.load(), 1000u);
    stop = true;
    daemon->reactor.sync([] {});
    ASSERT_TRUE(until([&] {
        const std::uint64_t before = ran;
        daemon->reactor.sync([] {});
        return before == ran;
    }));
}

TEST_F(IpcHostileTest, WithoutADescriptorLeftAConnectionIsRefusedAndTheServiceGoesOn) {
    ASSERT_TRUE(isServed());
    RawPeer refused, later;
    rlimit before{};
    getrlimit(RLIMIT_NOFILE, &before);
    const int firstFree = fcntl(0, F_DUPFD_CLOEXEC, 0);
    close(firstFree);
    rlimit none = before;
    none.rlim_cur = static_cast<rlim_t>(firstFree);
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &none), 0);
    EXPECT_TRUE(refused.connectTo(path()));
    EXPECT_TRUE(refused.seesEnd());
    EXPECT_TRUE(isServed());
    setrlimit(RLIMIT_NOFILE, &before);
    ASSERT_TRUE(until([&] { return lines().size() == 1; }));
    EXPECT_THAT(lines().front(), HasSubstr("no descriptor is left"));
    ASSERT_TRUE(later.connectTo(path()));
    ASSERT_TRUE(later.hello());
    expectHello(later);
}

TEST_F(IpcHostileTest, ADeadProcessHasNoEntitlements) {
    daemon->grants.change([](auto& all) { all["org.lumacast.granted"] = Value(true); });
    RawPeer heir;
    const pid_t child = fork();
    if (child == 0) _exit(heir.connectTo(path()) ? 0 : 1);
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_EQ(status, 0);
    // The child connected and died; its socket lives on here.
    ASSERT_TRUE(heir.hello());
    ASSERT_TRUE(until([&] { return delegate->accepted.get().size() == 2; }));
    const auto connection = delegate->last();
    ASSERT_TRUE(connection);
    EXPECT_EQ(connection->processIdentifier(), ProcessID{child});
    EXPECT_EQ(connection->valueForEntitlement("org.lumacast.granted"), std::nullopt);
    EXPECT_EQ(daemon->entitlementQuestions.get(), 0) << "its number may be another process's by now";
    const auto live = delegate->accepted.get().front().lock();
    EXPECT_EQ(live->valueForEntitlement("org.lumacast.granted"), std::optional(Value(true)));
}

}  // namespace
}  // namespace lumacast
