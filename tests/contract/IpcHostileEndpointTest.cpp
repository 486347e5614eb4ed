// Holders of an endpoint who misuse it.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <array>

#include "tests/contract/IpcHostileWorld.h"

namespace lumacast {
namespace {

using ::testing::HasSubstr;

class IpcHostileEndpointTest : public IpcHostileTest {
protected:
    /// An endpoint of an anonymous listener of the daemon, as a descriptor.
    int endpoint() {
        if (!anonymous) {
            anonymous = daemon->ipc->anonymousListener();
            anonymous->setDelegate(delegate);
            anonymous->resume();
        }
        endpoints.push_back(anonymous->endpoint());
        return LinuxIpc::descriptorOf(*endpoints.back());
    }
    bool connects(std::size_t index) {
        const auto connection = client->ipc->connectToEndpoint(endpoints[index]);
        connection->setRemoteInterface(daemonProtocol());
        connection->resume();
        Outcome outcome;
        connection->remoteProxy(outcome.onError())
            ->send(id(DaemonMessage::SynchronousGetCurrentState), {}, outcome.onReply());
        return until([&] { return outcome.replyCount() + outcome.errorCount() == 1; }) && outcome.replyCount() == 1;
    }
    void expectSpoilt(std::string_view reason) {
        ASSERT_TRUE(until([&] { return lines().size() == 1; }));
        EXPECT_THAT(lines().front(), HasSubstr(std::string(reason)));
        EXPECT_FALSE(connects(0));
        endpoint();
        EXPECT_TRUE(connects(1)) << "another endpoint of the same listener is as good as before";
        EXPECT_TRUE(isServed());
    }
    void TearDown() override {
        endpoints.clear();
        anonymous.reset();
        IpcHostileTest::TearDown();
    }
    std::shared_ptr<IpcListener> anonymous;
    std::vector<std::shared_ptr<IpcEndpoint>> endpoints;
};

TEST_F(IpcHostileEndpointTest, RungWithoutAConnectionIsClosed) {
    ASSERT_TRUE(sendRaw(endpoint(), Data{0}));
    expectSpoilt("something else than a connection");
}

TEST_F(IpcHostileEndpointTest, RungWithAFileIsClosed) {
    const Fd file(open("/dev/null", O_RDONLY | O_CLOEXEC));
    ASSERT_TRUE(sendRaw(endpoint(), Data{0}, {file.get()}));
    expectSpoilt("something else than a connection");
}

TEST_F(IpcHostileEndpointTest, RungWithTwoDescriptorsIsClosed) {
    std::array<int, 2> ends{};
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
    const Fd first(ends[0]), second(ends[1]);
    ASSERT_TRUE(sendRaw(endpoint(), Data{0}, {ends[0], ends[1]}));
    expectSpoilt("something else than a connection");
}

TEST_F(IpcHostileEndpointTest, RungWithSomebodyElsesConnectionIsClosed) {
    // A connection whose other end is another process: it would be taken for that one.
    std::array<int, 2> channel{};
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, channel.data()), 0);
    const Fd ours(channel[0]), theirs(channel[1]);
    const pid_t child = fork();
    if (child == 0) {
        std::array<int, 2> ends{};
        const bool made = socketpair(AF_UNIX, SOCK_STREAM, 0, ends.data()) == 0;
        _exit(made && sendRaw(theirs.get(), Data{0}, {ends[0]}) ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_EQ(status, 0);
    std::array<std::uint8_t, 1> byte{};
    iovec part{byte.data(), 1};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
    msghdr received{};
    received.msg_iov = &part;
    received.msg_iovlen = 1;
    received.msg_control = control.data();
    received.msg_controllen = control.size();
    ASSERT_EQ(recvmsg(ours.get(), &received, MSG_CMSG_CLOEXEC), 1);
    int stolen = -1;
    std::memcpy(&stolen, CMSG_DATA(CMSG_FIRSTHDR(&received)), sizeof stolen);
    const Fd owned(stolen);
    ASSERT_TRUE(sendRaw(endpoint(), Data{0}, {stolen}));
    expectSpoilt("something else than a connection");
}

TEST_F(IpcHostileEndpointTest, ShutDownByAHolderSpoilsThatOneOnly) {
    shutdown(endpoint(), SHUT_RDWR);
    EXPECT_FALSE(connects(0));
    endpoint();
    EXPECT_TRUE(connects(1));
}

TEST_F(IpcHostileEndpointTest, RungWithAPeerThatMisbehavesDropsThatPeer) {
    ASSERT_TRUE(isServed());
    std::array<int, 2> ends{};
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
    RawPeer peer{Fd(ends[0])};
    const Fd given(ends[1]);
    // The other end is kept here too, and blocking: neither may matter.
    ASSERT_TRUE(sendRaw(endpoint(), Data{0}, {given.get()}));
    ASSERT_TRUE(peer.send(Data{'X'}));
    expectDropped(peer, "its hello is none");
    EXPECT_TRUE(connects(0));
}

TEST_F(IpcHostileEndpointTest, CrossesAsAnInheritedDescriptor) {
    Fd inherited(dup(endpoint()));
    endpoints.push_back(LinuxIpc::endpointFrom(std::move(inherited)));
    EXPECT_TRUE(connects(1));
    EXPECT_EQ(LinuxIpc::endpointFrom(Fd(open("/dev/null", O_RDONLY | O_CLOEXEC))), nullptr);
}

}  // namespace
}  // namespace lumacast
