// Names in the runtime directory, and sockets that somebody else opened for us.

#include "linux/ipc/ServiceSocket.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "tests/contract/IpcPortWorld.h"
#include "tests/contract/RawPeer.h"

namespace lumacast {
namespace {

using ::testing::HasSubstr;

class ServiceSocketTest : public ::testing::Test {
protected:
    ServiceSocket open(const std::string& name = "service") {
        return ServiceSocket::open(runtime(), name, activated, log);
    }
    std::string runtime() const { return directory.path() + "/runtime"; }
    std::string path() const { return runtime() + "/service.sock"; }
    bool connects() const { return RawPeer().connectTo(path()); }
    void expectLine(std::string_view text) {
        ASSERT_EQ(log.recentLines().size(), 1u);
        EXPECT_THAT(log.recentLines().front(), HasSubstr(std::string(text)));
    }
    /// A socket bound at the service's path by somebody who knows nothing of the lock.
    Fd bindForeign() {
        std::filesystem::create_directory(runtime());
        std::filesystem::permissions(runtime(), std::filesystem::perms::owner_all);
        Fd foreign(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const sockaddr_un address = socketAddress(path());
        EXPECT_EQ(bind(foreign.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        return foreign;
    }

    ScratchDirectory directory;
    ActivatedSockets activated;
    Log log;
};

TEST_F(ServiceSocketTest, MakesItsDirectoryForTheUserAlone) {
    const ServiceSocket service = open();
    EXPECT_TRUE(connects());
    struct stat status {};
    ASSERT_EQ(stat(runtime().c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777, 0700u);
}

TEST_F(ServiceSocketTest, FreesItsNameAtTheEnd) {
    { const ServiceSocket service = open(); }
    EXPECT_FALSE(std::filesystem::exists(path()));
    const ServiceSocket again = open();
    EXPECT_TRUE(connects());
    EXPECT_TRUE(log.recentLines().empty());
}

TEST_F(ServiceSocketTest, ReplacesTheSocketOfADeadProcess) {
    bindForeign().reset();
    ASSERT_TRUE(std::filesystem::exists(path()));
    const ServiceSocket service = open();
    EXPECT_TRUE(connects());
    EXPECT_TRUE(log.recentLines().empty());
}

TEST_F(ServiceSocketTest, LeavesALiveServiceOfOursAlone) {
    const ServiceSocket first = open();
    const ServiceSocket second = open();
    EXPECT_LT(second.descriptor(), 0);
    expectLine("another process serves it");
    EXPECT_TRUE(connects());
}

TEST_F(ServiceSocketTest, ASecondServiceThatFailedDoesNotTakeTheNameAwayAtItsEnd) {
    const ServiceSocket first = open();
    { const ServiceSocket second = open(); }
    EXPECT_TRUE(connects());
}

TEST_F(ServiceSocketTest, LeavesALiveServiceOfOthersAlone) {
    const Fd foreign = bindForeign();
    ASSERT_EQ(listen(foreign.get(), 8), 0);
    {
        const ServiceSocket service = open();
        EXPECT_LT(service.descriptor(), 0);
        expectLine("another process serves it");
    }
    EXPECT_TRUE(connects());
}

TEST_F(ServiceSocketTest, LeavesAFileAtItsPathAlone) {
    std::filesystem::create_directory(runtime());
    std::filesystem::permissions(runtime(), std::filesystem::perms::owner_all);
    std::ofstream(path()) << "precious";
    const ServiceSocket service = open();
    EXPECT_LT(service.descriptor(), 0);
    expectLine("something else lies at its path");
    EXPECT_EQ(std::filesystem::file_size(path()), 8u);
}

TEST_F(ServiceSocketTest, RefusesADirectoryThatOthersCanWriteTo) {
    std::filesystem::create_directory(runtime());
    std::filesystem::permissions(runtime(), std::filesystem::perms::all);
    const ServiceSocket service = open();
    EXPECT_LT(service.descriptor(), 0);
    expectLine("others can write");
}

TEST_F(ServiceSocketTest, RefusesALinkInPlaceOfItsDirectory) {
    std::filesystem::create_directory(directory.path() + "/elsewhere");
    std::filesystem::create_directory_symlink(directory.path() + "/elsewhere", runtime());
    const ServiceSocket service = open();
    EXPECT_LT(service.descriptor(), 0);
    expectLine("the runtime directory is none");
}

TEST_F(ServiceSocketTest, RefusesNamesThatAreNoFileNames) {
    for (const char* name : {"", "a/b", "../a", ".", ".."}) EXPECT_LT(open(name).descriptor(), 0) << name;
    EXPECT_LT(open(std::string(200, 'x')).descriptor(), 0);
    EXPECT_EQ(log.recentLines().size(), 6u);
    for (const char* name : {"", "a/b", "../a"}) EXPECT_FALSE(connectToServiceSocket(runtime(), name)) << name;
}

// --- socket activation ---

Fd listeningAt(const std::string& path) {
    Fd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const sockaddr_un address = socketAddress(path);
    EXPECT_EQ(bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(listen(socket.get(), 8), 0);
    return socket;
}

TEST_F(ServiceSocketTest, PrefersTheSocketItWasGiven) {
    const std::string given = directory.path() + "/given.sock";
    activated.add("service", listeningAt(given));
    {
        const ServiceSocket service = open();
        EXPECT_GE(service.descriptor(), 0);
        EXPECT_FALSE(std::filesystem::exists(path()));
        EXPECT_TRUE(RawPeer().connectTo(given));
    }
    EXPECT_TRUE(std::filesystem::exists(given)) << "whoever made it removes it";
}

TEST_F(ServiceSocketTest, FindsItsOwnAmongTheSocketsItWasGiven) {
    Fd byName = listeningAt(directory.path() + "/a.sock");
    Fd byUnit = listeningAt(directory.path() + "/b.sock");
    Fd byPath = listeningAt(directory.path() + "/third.sock");
    const int name = byName.get(), unit = byUnit.get(), bound = byPath.get();
    activated.add("other", std::move(byPath));
    activated.add("second.socket", std::move(byUnit));
    activated.add("first", std::move(byName));
    EXPECT_EQ(open("first").descriptor(), name);
    EXPECT_EQ(open("second").descriptor(), unit);
    const Fd third = activated.take("third");
    EXPECT_EQ(third.get(), bound);
    EXPECT_FALSE(activated.take("fourth"));
}

/// Runs `body` in a child whose descriptors from 3 on are `sockets`; whether it answered true.
bool inActivatedChild(const std::vector<int>& sockets, const std::function<bool()>& body) {
    const pid_t child = fork();
    if (child == 0) {
        std::vector<int> copies;
        for (const int socket : sockets) copies.push_back(fcntl(socket, F_DUPFD, 100));
        int next = 3;
        for (const int copy : copies) dup2(copy, next++);
        setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1);
        setenv("LISTEN_FDS", std::to_string(sockets.size()).c_str(), 1);
        _exit(body() ? 0 : 1);
    }
    int status = -1;
    return waitpid(child, &status, 0) == child && status == 0;
}

TEST_F(ServiceSocketTest, TakesTheSocketsOfTheEnvironment) {
    const Fd one = listeningAt(directory.path() + "/one.sock");
    const Fd two = listeningAt(directory.path() + "/two.sock");
    EXPECT_TRUE(inActivatedChild({one.get(), two.get()}, [] {
        setenv("LISTEN_FDNAMES", "alpha:beta", 1);
        ActivatedSockets sockets = ActivatedSockets::fromEnvironment();
        const Fd beta = sockets.take("beta"), alpha = sockets.take("alpha");
        return beta.get() == 4 && alpha.get() == 3 && (fcntl(3, F_GETFD) & FD_CLOEXEC) && !std::getenv("LISTEN_FDS") &&
               !std::getenv("LISTEN_PID") && !std::getenv("LISTEN_FDNAMES");
    }));
}

TEST_F(ServiceSocketTest, IgnoresSocketsMeantForAnotherProcess) {
    const Fd one = listeningAt(directory.path() + "/one.sock");
    EXPECT_TRUE(inActivatedChild({one.get()}, [] {
        setenv("LISTEN_PID", std::to_string(getppid()).c_str(), 1);
        ActivatedSockets sockets = ActivatedSockets::fromEnvironment();
        return !sockets.take("one") && fcntl(3, F_GETFD) >= 0;
    }));
}

TEST_F(ServiceSocketTest, IgnoresAnEnvironmentOfNonsense) {
    EXPECT_TRUE(inActivatedChild({}, [] {
        for (const char* count : {"", "x", "-1", "99999999999", "2 "}) {
            setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1);
            setenv("LISTEN_FDS", count, 1);
            if (ActivatedSockets::fromEnvironment().take("service")) return false;
        }
        return true;
    }));
}

TEST_F(ServiceSocketTest, AServiceOnAnActivatedSocketServes) {
    const std::string given = directory.path() + "/given.sock";
    LinuxIpcOptions options;
    options.activated.add("service", listeningAt(given));
    IpcPort daemon(runtime(), std::move(options));
    const auto delegate = std::make_shared<RecordingDelegate>([](const auto& connection) {
        connection->resume();
        return true;
    });
    const auto listener = daemon.ipc->listenerForService("service");
    listener->setDelegate(delegate);
    listener->resume();
    RawPeer peer(given);
    ASSERT_TRUE(peer.hello());
    EXPECT_EQ(peer.read(kHelloBytes), makeHello());
}

TEST_F(ServiceSocketTest, ACallTellsAServiceWithoutRoomFromNone) {
    const ServiceCall toNobody = callServiceSocket(runtime(), "service");
    EXPECT_FALSE(toNobody.socket);
    EXPECT_FALSE(toNobody.isBusy);
    const Fd foreign = bindForeign();
    EXPECT_FALSE(callServiceSocket(runtime(), "service").isBusy) << "a socket that nobody listens at";
    ASSERT_EQ(listen(foreign.get(), 0), 0);
    const ServiceCall first = callServiceSocket(runtime(), "service");
    EXPECT_TRUE(first.socket);
    EXPECT_FALSE(first.isBusy);
    const ServiceCall second = callServiceSocket(runtime(), "service");
    EXPECT_FALSE(second.socket);
    EXPECT_TRUE(second.isBusy);
    const Fd accepted(accept(foreign.get(), nullptr, nullptr));
    EXPECT_TRUE(callServiceSocket(runtime(), "service").socket);
}

}  // namespace
}  // namespace lumacast
