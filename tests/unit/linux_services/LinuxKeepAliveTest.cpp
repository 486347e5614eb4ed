#include "linux/system/LinuxKeepAlive.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <array>

#include "tests/contract/ScratchDirectory.h"

namespace lumacast {
namespace {

/// The service manager's end of the notify socket; `abstract` for a name that is not in the file system.
struct Manager {
    explicit Manager(bool abstract = false) : socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
        name = (abstract ? "@" : "") + scratch.path("notify");
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::copy(name.begin(), name.end(), address.sun_path);
        if (abstract) address.sun_path[0] = '\0';
        const auto length = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + name.size());
        EXPECT_EQ(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), length), 0);
    }
    std::string receive() const {
        std::array<char, 1024> buffer;
        const ssize_t count = ::recv(socket.get(), buffer.data(), buffer.size(), 0);
        return count > 0 ? std::string(buffer.data(), static_cast<std::size_t>(count)) : "(nothing)";
    }
    ScratchDirectory scratch;
    Fd socket;
    std::string name;
};

TEST(LinuxKeepAlive, TheServiceManagerIsTold) {
    for (const bool abstract : {false, true}) {
        const Manager manager(abstract);
        LinuxKeepAlive keepAlive(manager.name);
        keepAlive.announceReady();
        EXPECT_EQ(manager.receive(), "READY=1\n");
        EXPECT_EQ(manager.receive(), "STATUS=Idle.\n");
        keepAlive.beginTransaction();
        EXPECT_EQ(manager.receive(), "STATUS=Recording.\n");
        keepAlive.beginTransaction();
        keepAlive.endTransaction();
        EXPECT_EQ(manager.receive(), "(nothing)");
        keepAlive.endTransaction();
        EXPECT_EQ(manager.receive(), "STATUS=Idle.\n");
        keepAlive.announceStopping(8);
        EXPECT_EQ(manager.receive(), "STOPPING=1\nEXTEND_TIMEOUT_USEC=8000000\n");
    }
}

TEST(LinuxKeepAlive, AnEndTooManyChangesNothing) {
    LinuxKeepAlive keepAlive("");
    keepAlive.endTransaction();
    keepAlive.beginTransaction();
    EXPECT_EQ(keepAlive.openTransactions(), 1);
}

TEST(NotifySocket, NobodyIsTolerated) {
    EXPECT_FALSE(NotifySocket("").send("READY=1\n"));
    EXPECT_FALSE(NotifySocket("@").send("READY=1\n"));
    EXPECT_FALSE(NotifySocket("relative").send("READY=1\n"));
    EXPECT_FALSE(NotifySocket("/no/such/socket").send("READY=1\n"));
    EXPECT_FALSE(NotifySocket("/" + std::string(200, 'x')).send("READY=1\n"));
}

TEST(NotifySocket, AManagerThatDoesNotReadHoldsNobodyUp) {
    const Manager manager;
    const NotifySocket socket(manager.name);
    bool refused = false;
    for (int i = 0; i < 100'000 && !refused; ++i) refused = !socket.send("STATUS=x\n");
    EXPECT_TRUE(refused);
}

}  // namespace
}  // namespace lumacast
