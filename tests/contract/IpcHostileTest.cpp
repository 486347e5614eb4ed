// Peers that break the rules: each is dropped with one line that says why, nothing it sent reaches anybody, no
// descriptor is left behind, and everybody else is served on.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <random>

#include "tests/contract/IpcHostileWorld.h"

namespace lumacast {
namespace {

using ::testing::HasSubstr;

// --- hello ---

struct BadHello {
    const char* name;
    Data bytes;
    const char* reason;
};

void PrintTo(const BadHello& hello, std::ostream* out) { *out << hello.name; }

class IpcBadHelloTest : public IpcHostileTest, public ::testing::WithParamInterface<BadHello> {};

TEST_P(IpcBadHelloTest, IsDroppedBeforeTheDelegateIsAsked) {
    ASSERT_TRUE(isServed());
    RawPeer peer(path());
    ASSERT_TRUE(peer.send(GetParam().bytes));
    expectDropped(peer, GetParam().reason);
    EXPECT_EQ(delegate->accepted.get().size(), 1u);
}

INSTANTIATE_TEST_SUITE_P(
    All, IpcBadHelloTest,
    ::testing::Values(BadHello{"WrongMagic", helloWith(0, 'X'), "its hello is none"},
                      BadHello{"WrongMagicInItsFirstByte", Data{'G'}, "its hello is none"},
                      BadHello{"WrongVersion", helloWith(8, 2), "its version is 2"},
                      BadHello{"TooLong", helloWith(12, limitOf(Limit::HelloBytes) + 1), "its hello is too long"},
                      BadHello{"TooShort", helloWith(12, 15), "its hello is too long"}),
    [](const auto& test) { return std::string(test.param.name); });

TEST_F(IpcHostileTest, AHelloWithDescriptorsIsRefused) {
    ASSERT_TRUE(isServed());
    RawPeer peer(path());
    ASSERT_TRUE(peer.send(makeHello(), {0}));
    expectDropped(peer, "descriptors with its hello");
}

TEST_F(IpcHostileTest, ALongerHelloOfThisVersionIsUnderstood) {
    RawPeer peer(path());
    Data hello = helloWith(12, 20);
    hello.insert(hello.end(), {1, 2, 3, 4});
    ASSERT_TRUE(peer.send(hello));
    ASSERT_TRUE(peer.send(message(DaemonMessage::PauseRecording, {}, 1)));
    EXPECT_TRUE(until([&] { return object->count() == 1; }));
}

TEST_F(IpcHostileTest, APeerThatSaysNothingIsDroppedAfterTheDeadline) {
    TearDown();
    LinuxIpcOptions options;
    options.helloDeadline = std::chrono::milliseconds(50);
    start(std::move(options));
    ASSERT_TRUE(isServed());
    RawPeer silent(path());
    expectDropped(silent, "no hello in time");
    RawPeer half(path());
    ASSERT_TRUE(half.send(Data{'L', 'C'}));
    expectDropped(half, "no hello in time", 1);
    EXPECT_EQ(delegate->accepted.get().size(), 1u);
}

// --- frames in pieces, in heaps and broken ---

TEST_F(IpcHostileTest, AGoodMessageInSingleBytesArrives) {
    RawPeer peer(path());
    for (const std::uint8_t byte : makeHello()) ASSERT_TRUE(peer.send(Data{byte}));
    for (const std::uint8_t byte : message(DaemonMessage::SetMicrophoneEnabled, {true}, 1))
        ASSERT_TRUE(peer.send(Data{byte}));
    ASSERT_TRUE(until([&] { return object->count() == 1; }));
    EXPECT_EQ(object->received.get().front().arguments, (Array{true}));
    EXPECT_TRUE(lines().empty());
}

TEST_F(IpcHostileTest, DescriptorsOfAMessageInPiecesAreItsOwn) {
    Data records;
    appendRecord(records, plane(16, 16, 64));
    appendRecord(records, plane(8, 8, 32));
    const Data value = encoded(Array{"h", "e", Data{}});
    Data withPlanes{9, 4, 0, 0, 0};
    withPlanes.insert(withPlanes.end(), value.begin() + 5, value.end());
    const Data dictionary{10, 2, 0, 0, 0, 1, 0, 0, 0, 'a', 13, 1, 1, 0, 0, 0, 'b', 13, 0};
    withPlanes.insert(withPlanes.end(), dictionary.begin(), dictionary.end());
    const Data frame =
        rawFrame(messageHeader(FrameKind::Request, id(DaemonMessage::SetupBroadcast), 2, 2), withPlanes, records);
    std::vector<Fd> owned;
    keep(owned, planeMemory(1024, kAllSeals));
    keep(owned, planeMemory(256, kAllSeals));

    RawPeer peer(path());
    ASSERT_TRUE(peer.hello());
    ASSERT_TRUE(peer.send(message(DaemonMessage::PauseRecording, {}, 1)));
    ASSERT_TRUE(peer.send(Bytes(frame).first(1), {owned[0].get()}));
    ASSERT_TRUE(peer.send(Bytes(frame).subspan(1, 30), {owned[1].get()}));
    ASSERT_TRUE(peer.send(Bytes(frame).subspan(31)));
    ASSERT_TRUE(until([&] { return object->count() == 2; })) << (lines().empty() ? "" : lines().back());
    {
        const auto received = object->received.get().back().arguments;
        const auto* userInfo = received[3].as<Dictionary>();
        ASSERT_TRUE(userInfo);
        EXPECT_EQ((*userInfo->find("a")->as<Value::PlaneRef>())->width(), 8);
        EXPECT_EQ((*userInfo->find("b")->as<Value::PlaneRef>())->pixels().size(), 1024u);
    }
    object->received.set({});
}

TEST_F(IpcHostileTest, DescriptorsHeapedOnAFrameThatNeverComesAreNotKept) {
    ASSERT_TRUE(isServed());
    RawPeer peer(path());
    ASSERT_TRUE(peer.hello());
    ASSERT_TRUE(peer.send(Data{0}, std::vector<int>(limitOf(Limit::HandlesPerMessage), 0)));
    ASSERT_TRUE(peer.send(Data{0}, {0}));
    expectDropped(peer, "descriptors without a message");
}

TEST_F(IpcHostileTest, ManyMessagesInOneWriteArriveInTheirOrder) {
    Data all = makeHello();
    constexpr std::uint64_t kCount = 3000;
    for (std::uint64_t i = 1; i <= kCount; ++i) {
        const Data one = message(DaemonMessage::ReportCameraUsage, {Value(static_cast<std::int32_t>(i))}, i);
        all.insert(all.end(), one.begin(), one.end());
    }
    RawPeer peer(path());
    ASSERT_TRUE(peer.send(all));
    ASSERT_TRUE(until([&] { return object->count() == kCount; }));
    EXPECT_EQ(object->received.get().back().arguments, (Array{Value(static_cast<std::int32_t>(kCount))}));
}

TEST_F(IpcHostileTest, WhatAPeerSaidBeforeItHungUpIsDelivered) {
    {
        RawPeer peer(path());
        ASSERT_TRUE(peer.hello());
        for (std::uint64_t i = 1; i <= 200; ++i) ASSERT_TRUE(peer.send(message(DaemonMessage::PauseRecording, {}, i)));
    }
    EXPECT_TRUE(until([&] { return object->count() == 200; }));
    EXPECT_TRUE(lines().empty()) << "hanging up is no fault";
}

TEST_F(IpcHostileTest, GarbageNeverReachesAnybodyAndNeverStopsTheService) {
    ASSERT_TRUE(isServed());
    const std::size_t before = object->count();
    std::mt19937 random(20'260'101);
    const auto any = [&](std::uint32_t below) { return static_cast<std::uint32_t>(random() % below); };
    for (int round = 0; round < 600; ++round) {
        Data frame = message(static_cast<DaemonMessage>(any(20)), {"text", Data(any(64)), Dictionary{{"k", 1.5}}}, 1);
        for (std::uint32_t flips = any(6); flips > 0; --flips)
            frame[any(frame.size())] = static_cast<std::uint8_t>(random());
        if (any(4) == 0) frame.resize(any(frame.size()) + 1);
        RawPeer peer(path());
        ASSERT_TRUE(peer.hello());
        peer.send(frame, any(8) == 0 ? std::vector<int>{0} : std::vector<int>());
        shutdown(peer.descriptor(), SHUT_WR);
        ASSERT_TRUE(peer.seesEnd());
    }
    EXPECT_TRUE(isServed());
    EXPECT_EQ(object->count(), before + 1);
}

// --- what a service may answer ---

class IpcHostileServiceTest : public IpcHostileTest {
protected:
    /// A service of raw bytes, and a client that has asked it something.
    void serve() {
        const std::string rawPath = directory.path() + "/raw.sock";
        const Fd door(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const sockaddr_un address = socketAddress(rawPath);
        ASSERT_EQ(bind(door.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        ASSERT_EQ(listen(door.get(), 1), 0);
        asking = client->ipc->connectToService("raw");
        asking->setRemoteInterface(daemonProtocol());
        loss.watch(*asking);
        asking->resume();
        asking->remoteProxy(outcome.onError())
            ->send(id(DaemonMessage::SynchronousGetCurrentState), {}, outcome.onReply());
        service = RawPeer(Fd(accept4(door.get(), nullptr, nullptr, SOCK_CLOEXEC)));
        expectHello(service);
        ASSERT_EQ(service.read(kFrameHeaderBytes).size(), kFrameHeaderBytes);
    }
    void expectLost(std::string_view reason) {
        ASSERT_TRUE(until([&] { return loss.invalidations.get() == 1; }));
        ASSERT_EQ(client->log.recentLines().size(), 1u);
        EXPECT_THAT(client->log.recentLines().front(), HasSubstr(std::string(reason)));
        EXPECT_EQ(outcome.replyCount() + outcome.errorCount(), 1u) << "told exactly once what became of its request";
    }
    void TearDown() override {
        client->reactor.sync([&] { asking.reset(); });
        service.close();
        IpcHostileTest::TearDown();
    }

    Outcome outcome;
    LossRecorder loss;
    std::shared_ptr<IpcConnection> asking;
    RawPeer service{Fd()};
};

TEST_F(IpcHostileServiceTest, OfAnotherVersionIsLeft) {
    serve();
    ASSERT_TRUE(service.send(helloWith(8, 9)));
    expectLost("its version is 9");
}

TEST_F(IpcHostileServiceTest, WithAnIllTypedReplyIsLeftAndTheRequestFails) {
    serve();
    ASSERT_TRUE(service.hello());
    ASSERT_TRUE(service.send(rawFrame(messageHeader(FrameKind::Reply, 0, 1), encoded(Array{true}))));
    expectLost("a reply with values of other types");
    EXPECT_EQ(outcome.errorCount(), 1u);
}

TEST_F(IpcHostileServiceTest, ThatRepliesTwiceIsLeft) {
    serve();
    ASSERT_TRUE(service.hello());
    const Data reply = rawFrame(messageHeader(FrameKind::Reply, 0, 1), encoded(Array{Value()}));
    ASSERT_TRUE(service.send(reply));
    ASSERT_TRUE(service.send(reply));
    expectLost("a reply to nothing");
    EXPECT_EQ(outcome.replyCount(), 1u);
}

TEST_F(IpcHostileServiceTest, ThatSendsMessagesNobodyExportedIsLeft) {
    serve();
    ASSERT_TRUE(service.hello());
    ASSERT_TRUE(service.send(rawFrame(setMicrophone(1), kTrue)));
    expectLost("unknown message");
    EXPECT_EQ(outcome.errorCount(), 1u);
}

}  // namespace
}  // namespace lumacast
