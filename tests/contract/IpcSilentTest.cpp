// Connections that say nothing: they keep nobody out, and the log short.

#include <gmock/gmock.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>

#include "tests/contract/IpcHostileWorld.h"

namespace lumacast {
namespace {

using ::testing::HasSubstr;

constexpr std::uint64_t kSilentPlaces = limitOf(Limit::ConnectionsBeforeHello);

class IpcSilentTest : public IpcHostileTest {
protected:
    /// Whether a newcomer gets in and its message arrives.
    void expectANewcomerIsServed() {
        const std::size_t before = object->count();
        RawPeer newcomer(path());
        ASSERT_TRUE(newcomer.hello());
        ASSERT_TRUE(newcomer.send(message(DaemonMessage::PauseRecording, {}, 1)));
        ASSERT_TRUE(until([&] { return object->count() == before + 1; })) << "locked out";
    }
};

TEST_F(IpcSilentTest, AsManyAsAUserMayHaveOpenKeepNobodyOut) {
    ASSERT_TRUE(isServed());
    std::vector<RawPeer> silent;
    for (std::uint64_t i = 0; i < limitOf(Limit::ConnectionsPerUser); ++i) {
        silent.emplace_back(path());
        if (i % 100 == 0) expectANewcomerIsServed();
    }
    expectANewcomerIsServed();
    EXPECT_TRUE(silent.front().seesEnd()) << "the oldest goes first";
    EXPECT_TRUE(isServed());
    ASSERT_TRUE(until([&] { return !lines().empty(); }));
    EXPECT_EQ(lines().size(), 1u) << "one line for the whole burst";
    EXPECT_THAT(lines().front(), HasSubstr("too many without a hello"));
    const std::size_t before = object->count();
    ASSERT_TRUE(silent.back().hello()) << "the youngest still may";
    ASSERT_TRUE(silent.back().send(message(DaemonMessage::PauseRecording, {}, 1)));
    EXPECT_TRUE(until([&] { return object->count() == before + 1; }));
}

/// Processes with silent connections, until it goes.
class Crowd {
public:
    /// Only system calls in the children: their parent has threads.
    Crowd(const std::string& path, std::uint64_t processes, std::uint64_t connectionsEach) {
        const sockaddr_un address = socketAddress(path);
        EXPECT_EQ(pipe2(done_.data(), O_CLOEXEC), 0);
        EXPECT_EQ(pipe2(end_.data(), O_CLOEXEC), 0);
        for (std::uint64_t i = 0; i < processes; ++i) {
            const pid_t child = fork();
            if (child == 0) {
                close(end_[1]);
                for (std::uint64_t n = 0; n < connectionsEach; ++n)
                    (void)!connect(socket(AF_UNIX, SOCK_STREAM, 0), reinterpret_cast<const sockaddr*>(&address),
                                   sizeof address);
                char byte = 0;
                (void)!write(done_[1], &byte, 1);
                (void)!read(end_[0], &byte, 1);
                _exit(0);
            }
            EXPECT_GT(child, 0);
            children_.push_back(child);
        }
        char byte = 0;
        for (std::uint64_t i = 0; i < processes; ++i) EXPECT_EQ(read(done_[0], &byte, 1), 1);
    }
    Crowd(const Crowd&) = delete;
    Crowd& operator=(const Crowd&) = delete;
    ~Crowd() {
        for (const int descriptor : {done_[0], done_[1], end_[0], end_[1]}) close(descriptor);
        for (const pid_t child : children_) waitpid(child, nullptr, 0);
    }

private:
    std::array<int, 2> done_{-1, -1};
    std::array<int, 2> end_{-1, -1};
    std::vector<pid_t> children_;
};

TEST_F(IpcSilentTest, OneThatIsSlowToSayHelloIsNotPushedOutByAnotherProcess) {
    ASSERT_TRUE(isServed());
    RawPeer slow(path());
    ASSERT_TRUE(slow.send(Data{'L', 'C'}));
    expectHello(slow);  // it is in
    const Crowd crowd(path(), 1, 4 * kSilentPlaces);
    expectANewcomerIsServed();  // behind all of the crowd
    const std::size_t before = object->count();
    ASSERT_TRUE(slow.send(Bytes(makeHello()).subspan(2)));
    ASSERT_TRUE(slow.send(message(DaemonMessage::PauseRecording, {}, 1)));
    EXPECT_TRUE(until([&] { return object->count() == before + 1; })) << "pushed out";
}

TEST_F(IpcSilentTest, AHelloThatOnlyWasNotReadYetIsNoSilence) {
    ASSERT_TRUE(isServed());
    const Crowd crowd(path(), kSilentPlaces, 1);
    const std::size_t before = delegate->accepted.get().size();
    std::vector<RawPeer> peers;
    // The reactor is held up, so that several of one process wait at the door with their hello sent.
    daemon->reactor.sync([&] {
        for (int i = 0; i < 12; ++i) {
            RawPeer& peer = peers.emplace_back(path());
            ASSERT_TRUE(peer.hello());
        }
    });
    EXPECT_TRUE(until([&] { return delegate->accepted.get().size() == before + peers.size(); }));
    EXPECT_LE(lines().size(), 1u);
}

}  // namespace
}  // namespace lumacast
