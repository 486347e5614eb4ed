#pragma once
// A service with one well-behaved client, over real sockets, for peers that break the rules; and the bytes they say.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "base/Limits.h"
#include "base/MessageTables.h"
#include "tests/contract/IpcPortWorld.h"
#include "tests/contract/RawPeer.h"

namespace lumacast {

inline constexpr auto kService = "org.lumacast.test";
inline constexpr auto kAllSeals = F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_WRITE;

inline constexpr std::uint16_t id(DaemonMessage message) { return static_cast<std::uint16_t>(message); }

/// A service with one well-behaved client.
class IpcHostileTest : public ::testing::Test {
protected:
    void SetUp() override { start({}); }

    void start(LinuxIpcOptions options) {
        descriptorsBefore = openDescriptors();
        daemon = std::make_unique<IpcPort>(directory.path(), std::move(options));
        client = std::make_unique<IpcPort>(directory.path());
        object = std::make_shared<RecordingObject>(world_, Side::Daemon);
        answerState();
        delegate = std::make_shared<RecordingDelegate>([this](const auto& connection) {
            connection->setExportedInterface(daemonProtocol());
            connection->setExportedObject(object);
            connection->setRemoteInterface(clientProtocol());
            connection->resume();
            return true;
        });
        listener = daemon->ipc->listenerForService(kService);
        listener->setDelegate(delegate);
        listener->resume();
        friendly = connectFriendly();
    }

    void TearDown() override {
        friendly.reset();
        listener.reset();
        // What is still being delivered looks at both.
        client->stop();
        daemon->stop();
        client.reset();
        daemon.reset();
        EXPECT_EQ(openDescriptors(), descriptorsBefore) << "descriptors were leaked";
    }

    std::shared_ptr<IpcConnection> connectFriendly() {
        auto connection = client->ipc->connectToService(kService);
        connection->setRemoteInterface(daemonProtocol());
        connection->resume();
        return connection;
    }

    /// Answers the requests that the well-behaved client makes.
    void answerState() {
        object->onMessage.set([](const auto&, const IpcReply& reply) {
            if (reply) reply({Value()});
        });
    }

    [[nodiscard]] bool until(const std::function<bool()>& condition) {
        const auto limit = std::chrono::steady_clock::now() + std::chrono::seconds(30);
        while (!condition()) {
            if (std::chrono::steady_clock::now() > limit) return false;
            daemon->reactor.sync([] {});
            std::this_thread::yield();
        }
        return true;
    }

    /// Whether a round trip of the well-behaved client works.
    [[nodiscard]] bool isServed() {
        Outcome outcome;
        friendly->remoteProxy(outcome.onError())
            ->send(id(DaemonMessage::SynchronousGetCurrentState), {}, outcome.onReply());
        return until([&] { return outcome.replyCount() + outcome.errorCount() == 1; }) && outcome.replyCount() == 1;
    }

    std::string path() const { return directory.path() + "/" + kService + ".sock"; }
    std::vector<std::string> lines() const { return daemon->log.recentLines(); }

    /// A message of the daemon's protocol, in raw bytes.
    static Data message(DaemonMessage message, const Array& arguments, std::uint64_t sequence) {
        const bool isRequest = daemonProtocol().messages[id(message)].reply == Reply::Expected;
        return rawFrame(messageHeader(isRequest ? FrameKind::Request : FrameKind::Message, id(message), sequence),
                        encoded(arguments));
    }

    /// Expects the peer to be dropped with one line with its process and `reason`, and the friendly client to be
    /// served.
    void expectDropped(RawPeer& peer, std::string_view reason, std::size_t linesBefore = 0) {
        EXPECT_TRUE(peer.seesEnd());
        ASSERT_TRUE(until([&] { return lines().size() > linesBefore; })) << "no line says why";
        EXPECT_TRUE(isServed());
        EXPECT_EQ(lines().size(), linesBefore + 1);
        EXPECT_THAT(lines().back(), ::testing::HasSubstr("process " + std::to_string(getpid())));
        EXPECT_THAT(lines().back(), ::testing::HasSubstr(std::string(reason)));
    }

    /// Waits for the service's answer to the hello, which shows that the connection works.
    static void expectHello(RawPeer& peer) { EXPECT_EQ(peer.read(kHelloBytes), makeHello()); }

    ScratchDirectory directory;
    std::size_t descriptorsBefore = 0;
    std::unique_ptr<IpcPort> daemon;
    std::unique_ptr<IpcPort> client;
    std::shared_ptr<RecordingObject> object;
    std::shared_ptr<RecordingDelegate> delegate;
    std::shared_ptr<IpcListener> listener;
    std::shared_ptr<IpcConnection> friendly;

private:
    /// The recording object asks it on which lane it is.
    class Lanes final : public IpcWorld {
    public:
        explicit Lanes(IpcHostileTest& test) : test_(test) {}
        Ipc& ipc(Side) override { return *test_.daemon->ipc; }
        void on(Side, const Task& task) override { test_.daemon->reactor.sync(task); }
        bool isOnMainQueue(Side) override { return test_.daemon->reactor.isCurrent(); }
        void settle() override {}
        ProcessID pid(Side) override { return ProcessID{getpid()}; }
        void grant(Side, const std::string&, Value) override {}

    private:
        IpcHostileTest& test_;
    };
    Lanes world_{*this};
};

// --- what peers say ---

inline Data helloWith(std::size_t at, std::uint8_t byte) {
    Data hello = makeHello();
    hello[at] = byte;
    return hello;
}

inline Data nestedArrays(std::uint64_t depth) {
    Data bytes;
    for (std::uint64_t i = 0; i < depth; ++i) bytes.insert(bytes.end(), {9, 1, 0, 0, 0});
    bytes.push_back(0);
    return bytes;
}

inline Data arguments(const Data& inner) {
    Data bytes{9, 1, 0, 0, 0};
    bytes.insert(bytes.end(), inner.begin(), inner.end());
    return bytes;
}

inline FrameHeader setMicrophone(std::uint64_t sequence = 2, std::uint8_t handles = 0) {
    return messageHeader(FrameKind::Message, id(DaemonMessage::SetMicrophoneEnabled), sequence, handles);
}

inline PlaneRecord plane(std::int32_t width, std::int32_t height, std::uint64_t stride,
                         std::vector<PixelRect> damage = {}) {
    return {1, width, height, stride, 1, std::move(damage)};
}

inline std::vector<int> keep(std::vector<Fd>& owned, Fd descriptor) {
    owned.push_back(std::move(descriptor));
    return {owned.back().get()};
}

inline const Data kTrue = encoded(Array{true});

}  // namespace lumacast
