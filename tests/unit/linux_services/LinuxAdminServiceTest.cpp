// What the contract suite doesn't ask: limits, peers that misbehave, a daemon that does not answer.
#include "linux/admin/LinuxAdminService.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cstring>

#include "linux/admin/UnixSocket.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/fakes/ThreadLoop.h"
#include "tests/unit/linux_services/Until.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

constexpr LinuxAdminService::Limits kPatient{30s, 30s, 30s};

struct Daemon {
    explicit Daemon(LinuxAdminService::Limits limits = kPatient) : admin(scheduler, path, limits) {}
    void resume() {
        admin.resume([this] {
            ++snapshots;
            return Dictionary{{"sessions", Array{}}, {"storage", Dictionary{{"free", std::int64_t{5}}}}};
        });
        ASSERT_TRUE(admin.isAnswering());
    }
    std::string ask(std::string_view request, std::chrono::milliseconds limit = 30s) const {
        return askAdminService(path, request, limit).value_or("(nothing)");
    }
    /// Sends raw bytes and answers all that comes until the daemon closes the connection.
    std::string converse(const std::string& bytes) const {
        const Fd socket = connectTo(path);
        EXPECT_EQ(::send(socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL), static_cast<ssize_t>(bytes.size()));
        return readAll(socket);
    }
    static std::string readAll(const Fd& socket) {
        std::string text;
        std::array<char, 4096> buffer;
        EXPECT_TRUE(until([&] {
            const ssize_t count = ::recv(socket.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
            if (count > 0) text.append(buffer.data(), static_cast<std::size_t>(count));
            return count == 0 || (count < 0 && errno != EAGAIN);
        }));
        return text;
    }

    ScratchDirectory scratch;
    const std::string path = scratch.path("admin.sock");
    const std::shared_ptr<ThreadLoop> loop = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler{loop};
    std::atomic<int> snapshots{0};
    LinuxAdminService admin;
};

struct RunningDaemon : Daemon {
    explicit RunningDaemon(LinuxAdminService::Limits limits = kPatient) : Daemon(limits) { resume(); }
    RunningThreadLoop running{*loop};
};

const std::string kStatus = R"({"sessions":[],"storage":{"free":5}})";

TEST(LinuxAdminService, StatusIsEverythingAndAWordItsEntry) {
    RunningDaemon daemon;
    EXPECT_EQ(daemon.ask("status"), kStatus);
    EXPECT_EQ(daemon.ask("storage"), R"({"free":5})");
    EXPECT_EQ(daemon.ask("delete everything"), R"({"error":"unknown request"})");
    EXPECT_EQ(daemon.ask(""), R"({"error":"unknown request"})");
}

TEST(LinuxAdminService, TheSocketIsThisUsersAloneAndGoesWithTheService) {
    Daemon daemon;
    const std::string path = daemon.scratch.path("other.sock");
    {
        LinuxAdminService admin(daemon.scheduler, path);
        EXPECT_FALSE(std::filesystem::exists(path)) << "not before it resumes";
        admin.resume([] { return Dictionary(); });
        struct stat status = {};
        ASSERT_EQ(::stat(path.c_str(), &status), 0);
        EXPECT_EQ(status.st_mode & 07777, 0600u);
    }
    EXPECT_FALSE(std::filesystem::exists(path));
}

TEST(LinuxAdminService, ALineMayComeInPiecesAndWithMoreBehindIt) {
    RunningDaemon daemon;
    const Fd socket = connectTo(daemon.path);
    for (const char* piece : {"sta", "tus\r", "\nmore\n"}) ASSERT_GT(::send(socket.get(), piece, strlen(piece), 0), 0);
    EXPECT_EQ(Daemon::readAll(socket), kStatus + "\n");
    EXPECT_EQ(daemon.snapshots, 1);
}

TEST(LinuxAdminService, ALineTooLongIsRefused) {
    RunningDaemon daemon;
    EXPECT_EQ(daemon.converse(std::string(16 * 1024 + 1, 'x')), "{\"error\":\"the request is too long\"}\n");
    EXPECT_EQ(daemon.converse(std::string(16 * 1024, 'x') + "\n"), "{\"error\":\"unknown request\"}\n");
    EXPECT_EQ(daemon.ask("status"), kStatus);
}

TEST(LinuxAdminService, APeerThatSaysNothingIsSentAway) {
    RunningDaemon daemon({20ms, 30s, 30s});
    const Fd socket = connectTo(daemon.path);
    EXPECT_EQ(Daemon::readAll(socket), "");
    EXPECT_EQ(daemon.snapshots, 0);
}

TEST(LinuxAdminService, APeerThatLeavesIsForgotten) {
    RunningDaemon daemon;
    for (int i = 0; i < 50; ++i) {
        const Fd socket = connectTo(daemon.path);
        if (i % 2 == 0) (void)::send(socket.get(), "status\n", 7, MSG_NOSIGNAL);
    }
    EXPECT_EQ(daemon.ask("status"), kStatus);
}

TEST(LinuxAdminService, PeersBeyondTheLimitWaitUntilOneLeaves) {
    RunningDaemon daemon;
    std::vector<Fd> silent;
    for (int i = 0; i < 8; ++i) silent.push_back(connectTo(daemon.path));
    EXPECT_EQ(daemon.ask("status", 50ms), "(nothing)");
    silent.pop_back();
    EXPECT_EQ(daemon.ask("status"), kStatus);
}

TEST(LinuxAdminService, ADaemonThatDoesNotAnswerIsBusy) {
    Daemon daemon({30s, 30ms, 30s});  // its main queue does not run
    daemon.resume();
    for (int i = 0; i < 20; ++i) EXPECT_EQ(daemon.ask("status"), R"({"error":"the daemon is busy"})");
    EXPECT_EQ(daemon.snapshots, 0);
    const RunningThreadLoop running(*daemon.loop);
    EXPECT_TRUE(until([&] { return daemon.ask("status") == kStatus; }));
    EXPECT_LE(daemon.snapshots, 20) << "questions don't pile up behind a busy main queue";
}

TEST(LinuxAdminService, QuestionsOfPeersThatHaveLeftKeepNobodyFromBeingAnswered) {
    Daemon daemon({30s, 2s, 30s});  // its main queue does not run yet
    daemon.resume();
    for (int i = 0; i < 8; ++i) EXPECT_EQ(daemon.ask("status", 20ms), "(nothing)");
    const Fd socket = connectTo(daemon.path);
    ASSERT_GT(::send(socket.get(), "status\n", 7, MSG_NOSIGNAL), 0);
    EXPECT_EQ(daemon.ask("status", 20ms), "(nothing)") << "whoever came before has been read by then";
    const RunningThreadLoop running(*daemon.loop);
    EXPECT_EQ(Daemon::readAll(socket), kStatus + "\n");
}

TEST(LinuxAdminService, ACommandGoesBeforeAnEntryOfItsName) {
    Daemon daemon;
    daemon.admin.addCommand("storage", [](const std::vector<std::string>& arguments, const AdminAnswer& answer) {
        answer({{"words", static_cast<std::int64_t>(arguments.size())}});
    });
    daemon.resume();
    const RunningThreadLoop running(*daemon.loop);
    EXPECT_EQ(daemon.ask("storage"), R"({"words":0})");
    EXPECT_EQ(daemon.ask(" storage\tof  mine "), R"({"words":2})");
    EXPECT_EQ(daemon.ask("status"), kStatus);
    EXPECT_EQ(daemon.ask("sessions"), "[]");
    EXPECT_EQ(daemon.ask("status of mine"), R"({"error":"unknown request"})") << "only commands take arguments";
}

TEST(LinuxAdminService, ACommandThatDoesNotAnswerInTimeIsBusyAndTooManyOfThemAreRefused) {
    Daemon daemon({30s, 30s, 30s, 30ms});
    std::vector<AdminAnswer> pending;
    daemon.admin.addCommand("slow", [&](const std::vector<std::string>&, AdminAnswer answer) {
        pending.push_back(std::move(answer));
    });
    daemon.resume();
    {
        const RunningThreadLoop running(*daemon.loop);
        for (int i = 0; i < 8; ++i) EXPECT_EQ(daemon.ask("slow"), R"({"error":"the daemon is busy"})");
        EXPECT_EQ(daemon.ask("slow"), R"({"error":"the daemon is busy with other commands"})");
        EXPECT_EQ(daemon.ask("status"), kStatus) << "questions are none";
    }
    ASSERT_EQ(pending.size(), 8u);
    pending[0]({{"late", true}});
    const RunningThreadLoop running(*daemon.loop);
    EXPECT_EQ(daemon.ask("slow"), R"({"error":"the daemon is busy"})") << "one has ended: there is room again";
    EXPECT_EQ(daemon.ask("status"), kStatus) << "nobody is given a late answer";
}

TEST(LinuxAdminService, ASnapshotUnderWayOutlivesTheService) {
    const auto loop = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler(loop);
    ScratchDirectory scratch;
    std::atomic<int> snapshots{0};
    {
        LinuxAdminService admin(scheduler, scratch.path("admin.sock"), {30s, 10ms, 30s});
        admin.resume([&] {
            ++snapshots;
            return Dictionary();
        });
        EXPECT_EQ(askAdminService(scratch.path("admin.sock"), "status", 30s), R"({"error":"the daemon is busy"})");
    }
    std::atomic<bool> ran{false};
    loop->async([&] { ran = true; });
    const RunningThreadLoop running(*loop);
    EXPECT_TRUE(until([&] { return ran.load(); }));
    EXPECT_EQ(snapshots, 0) << "nobody is asked for a service that has gone";
}

TEST(LinuxAdminService, ASocketLeftBehindIsReplacedAndALivingOneIsNot) {
    Daemon first;
    { const Fd dead = listenAt(first.path); }
    ASSERT_TRUE(std::filesystem::exists(first.path));
    first.resume();
    std::string why;
    LinuxAdminService second(first.scheduler, first.path, {}, [&](std::string_view reason) { why = reason; });
    second.resume([] { return Dictionary(); });
    EXPECT_FALSE(second.isAnswering());
    EXPECT_EQ(why, "another process serves it");
    const RunningThreadLoop running(*first.loop);
    EXPECT_EQ(first.ask("status"), kStatus);
}

TEST(LinuxAdminService, WhatIsNoSocketIsLeftAlone) {
    Daemon daemon;
    daemon.scratch.write("admin.sock", "precious");
    daemon.admin.resume([] { return Dictionary(); });
    EXPECT_FALSE(daemon.admin.isAnswering());
    EXPECT_EQ(ScratchDirectory::read(daemon.path), "precious");
}

TEST(UnixSocket, ThePeersUserIsKnown) {
    std::array<int, 2> ends{};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
    const Fd near(ends[0]), far(ends[1]);
    EXPECT_EQ(peerUser(near.get()), ::geteuid());
    EXPECT_EQ(peerUser(-1), std::nullopt);
}

}  // namespace
}  // namespace lumacast
