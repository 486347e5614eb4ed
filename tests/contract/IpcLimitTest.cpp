// Every limit is kept: one overflow for each row of the table.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <array>

#include "tests/contract/IpcHostileWorld.h"

namespace lumacast {
namespace {

using ::testing::HasSubstr;

/// One overflow for each row of the table. A new row without its case here does not compile.
class IpcLimitTest : public IpcHostileTest, public ::testing::WithParamInterface<LimitRow> {
protected:
    void overflow(Limit limit) {
        RawPeer peer(path());
        switch (limit) {
            case Limit::MessageBytes: {
                FrameHeader header = setMicrophone(1);
                header.valueBytes = static_cast<std::uint32_t>(limitOf(limit) + 1 - kFrameHeaderBytes);
                peer.hello();
                peer.send(rawFrame(header, {}, {}, true));
                return expectDropped(peer, "over the size limit");
            }
            case Limit::MessageDepth:
                peer.hello();
                peer.send(rawFrame(setMicrophone(1), nestedArrays(limitOf(limit))));
                expectDropped(peer, "other types");  // as deep as the limit is read
                peer = RawPeer(path());
                peer.hello();
                peer.send(rawFrame(setMicrophone(1), nestedArrays(limitOf(limit) + 1)));
                return expectDropped(peer, "malformed message", 1);
            case Limit::HandlesPerMessage:
                peer.hello();
                peer.send(rawFrame(setMicrophone(1), kTrue), std::vector<int>(limitOf(limit) + 1, 0));
                return expectDropped(peer, "too many descriptors");
            case Limit::ConnectionsPerUser: return overflowConnections();
            case Limit::MessagesInFlight: return overflowRequests(peer);
            case Limit::QueuedBytesPerReader: return overflowReplies(peer);
            case Limit::ContextIdentifiersPerRequest: return overflowContextIdentifiers(peer);
            case Limit::HelloBytes:
                peer.send(helloWith(12, static_cast<std::uint8_t>(limitOf(limit) + 1)));
                return expectDropped(peer, "its hello is too long");
            case Limit::PlanesLeased: return overflowLeases(peer);
            case Limit::MessageValues:
                // One value is the list itself.
                peer.hello();
                peer.send(rawFrame(setMicrophone(1), nulls(limitOf(limit) - 1)));
                expectDropped(peer, "other types");  // as many as the limit are read
                peer = RawPeer(path());
                peer.hello();
                peer.send(rawFrame(setMicrophone(1), nulls(limitOf(limit))));
                return expectDropped(peer, "malformed message", 1);
            case Limit::HeldBytesPerUser: return overflowUnfinished();
            case Limit::ConnectionsBeforeHello: return overflowSilent(peer);
            case Limit::RequestsWithoutReply: return overflowUnanswered();
            case Limit::StartsWaitingForUser:
            case Limit::StartsOfApplicationWaitingForUser:
            case Limit::ArchiveBytes:
            case Limit::ArchiveDepth:
            case Limit::ExtensionsInstalled:
            case Limit::ExtensionItemsReturned:
            case Limit::ExtensionRequestsInFlight:
            case Limit::FramesAtExtension: FAIL() << "not kept by the connections";
        }
        FAIL() << "no overflow for this limit";
    }

    static Data nulls(std::uint64_t count) {
        Data bytes{9};
        for (unsigned i = 0; i < 4; ++i) bytes.push_back(static_cast<std::uint8_t>(count >> (8 * i)));
        bytes.resize(bytes.size() + count);
        return bytes;
    }

    void overflowUnfinished() {
        // Each says almost all of the longest message.
        const std::uint64_t size = limitOf(Limit::MessageBytes);
        FrameHeader header = setMicrophone(1);
        header.valueBytes = static_cast<std::uint32_t>(size - kFrameHeaderBytes);
        const Data almost = rawFrame(header, Data(header.valueBytes - 1), {}, true);
        const std::uint64_t fitting = limitOf(Limit::HeldBytesPerUser) / size;
        std::vector<RawPeer> peers;
        for (std::uint64_t i = 0; i < fitting; ++i) {
            ASSERT_TRUE(peers.emplace_back(path()).hello());
            ASSERT_TRUE(peers.back().send(almost));
        }
        EXPECT_TRUE(isServed());
        EXPECT_TRUE(lines().empty()) << "the limit itself is fine";
        RawPeer excess(path());
        excess.hello();
        excess.send(almost);
        expectDropped(excess, "its user has too many unfinished messages");
        peers.pop_back();
        ASSERT_TRUE(until([&] { return lines().size() == 2; })) << "of the truncated message";
        RawPeer next(path());
        ASSERT_TRUE(next.hello());
        ASSERT_TRUE(next.send(almost));
        ASSERT_TRUE(next.send(Data{0}));
        expectDropped(next, "malformed message", 2);
    }

    void overflowConnections() {
        std::vector<RawPeer> peers;
        // The friendly client has a place; the one that the caller made has said nothing and has none.
        for (std::uint64_t i = 1; i < limitOf(Limit::ConnectionsPerUser); ++i) {
            ASSERT_TRUE(peers.emplace_back(path()).hello());
            if (i % 100 == 0) { ASSERT_TRUE(isServed()); }
        }
        expectHello(peers.back());
        RawPeer excess(path());
        excess.hello();
        expectDropped(excess, "has too many");
        peers.pop_back();
        ASSERT_TRUE(until([&] {
            RawPeer next(path());
            return next.hello() && next.read(kHelloBytes) == makeHello();
        })) << "a closed connection makes room";
    }

    /// `oldest` is one that has said nothing.
    void overflowSilent(RawPeer& oldest) {
        std::vector<RawPeer> others;
        while (others.size() + 1 < limitOf(Limit::ConnectionsBeforeHello)) others.emplace_back(path());
        for (RawPeer& other : others) expectHello(other);
        EXPECT_TRUE(lines().empty()) << "the limit itself is fine";
        others.emplace_back(path());
        expectDropped(oldest, "too many without a hello");
        EXPECT_TRUE(others.front().hello());
        others.front().send(message(DaemonMessage::PauseRecording, {}, 1));
        EXPECT_TRUE(until([&] { return object->count() > 2; })) << "only the oldest goes";
    }

    void overflowRequests(RawPeer& peer) {
        object->onMessage.set({});
        peer.hello();
        for (std::uint64_t i = 1; i <= limitOf(Limit::MessagesInFlight); ++i)
            peer.send(message(DaemonMessage::SynchronousGetCurrentState, {}, i));
        ASSERT_TRUE(until([&] { return object->count() == 1 + limitOf(Limit::MessagesInFlight); }));
        EXPECT_TRUE(lines().empty()) << "the limit itself is fine";
        answerState();
        peer.send(message(DaemonMessage::SynchronousGetCurrentState, {}, 1 + limitOf(Limit::MessagesInFlight)));
        expectDropped(peer, "too many requests in flight");
    }

    /// It is the asker who keeps this limit: the other end says how many there are.
    void overflowUnanswered() {
        object->onMessage.set([this](const auto&, const IpcReply& reply) {
            const auto received = object->received.get();
            object->received.set({});
            if (received.back().message == id(DaemonMessage::SynchronousGetCurrentState)) reply({Value()});
        });
        const std::uint64_t limit = limitOf(Limit::RequestsWithoutReply);
        std::vector<Outcome> outcomes(limit + 1);
        for (std::uint64_t i = 0; i <= limit; ++i) {
            if (i == limit || i % 32 == 0) { ASSERT_TRUE(isServed()); }
            EXPECT_EQ(outcomes[0].errorCount(), 0u) << "the limit itself is fine";
            friendly->remoteProxy(outcomes[i].onError())
                ->send(id(DaemonMessage::DiscardRecording), {}, outcomes[i].onReply());
        }
        ASSERT_TRUE(until([&] { return outcomes[0].errorCount() == 1; }));
        EXPECT_TRUE(isServed());
        EXPECT_EQ(outcomes[1].errorCount(), 0u);
        EXPECT_TRUE(lines().empty());
    }

    void overflowReplies(RawPeer& peer) {
        object->onMessage.set([](const auto&, const IpcReply& reply) {
            reply({Dictionary{{"k", Data(limitOf(Limit::MessageBytes) / 2)}}});
        });
        peer.hello();
        const std::uint64_t enough = 4 * limitOf(Limit::QueuedBytesPerReader) / limitOf(Limit::MessageBytes);
        for (std::uint64_t i = 1; i <= enough; ++i)
            peer.send(message(DaemonMessage::SynchronousGetCurrentState, {}, i));
        ASSERT_TRUE(until([&] { return !lines().empty(); }));
        expectLine("it does not read its replies");
    }

    void overflowContextIdentifiers(RawPeer& peer) {
        const auto start = [](std::uint64_t count) {
            const Array ids(count, Value(std::uint32_t{1}));
            return Array{ids, Array{1.0, 1.0}, false, false, false, false, false, Value()};
        };
        object->onMessage.set({});
        peer.hello();
        peer.send(message(DaemonMessage::StartRecording, start(limitOf(Limit::ContextIdentifiersPerRequest)), 1));
        ASSERT_TRUE(until([&] { return object->count() == 2; }));
        answerState();
        peer.send(message(DaemonMessage::StartRecording, start(limitOf(Limit::ContextIdentifiersPerRequest) + 1), 2));
        expectDropped(peer, "other types");
    }

    void overflowLeases(RawPeer& peer) {
        // The peer never gives one back.
        peer.hello();
        peer.send(message(DaemonMessage::PauseRecording, {}, 1));
        ASSERT_TRUE(until([&] { return object->count() == 2; }));
        const auto connection = object->received.get().back().connection.lock();
        ASSERT_TRUE(connection);
        std::vector<std::weak_ptr<SharedPlane>> planes;
        Outcome outcome;
        for (std::uint64_t i = 0; i < limitOf(Limit::PlanesLeased) + 3; ++i) {
            const auto plane = std::make_shared<PlainPlane>(4, 4);
            planes.push_back(plane);
            connection->remoteProxy(outcome.onError())
                ->send(static_cast<std::uint16_t>(ClientMessage::CaptureHandlerWithSample),
                       {Value(Value::PlaneRef(plane)), Data{}});
        }
        ASSERT_TRUE(until([&] { return outcome.errorCount() == 3; }));
        for (std::uint64_t i = 0; i < planes.size(); ++i)
            EXPECT_EQ(planes[i].expired(), i >= limitOf(Limit::PlanesLeased)) << i;
        peer.close();
        EXPECT_TRUE(until([&] { return planes.front().expired(); }));
    }

    void expectLine(std::string_view reason) {
        EXPECT_EQ(lines().size(), 1u);
        EXPECT_THAT(lines().front(), HasSubstr(std::string(reason)));
        answerState();
        EXPECT_TRUE(isServed());
    }
};

TEST_P(IpcLimitTest, IsKept) {
    ASSERT_TRUE(isServed());
    overflow(GetParam().limit);
}

std::string limitName(const ::testing::TestParamInfo<LimitRow>& info) {
    switch (info.param.limit) {
        case Limit::MessageBytes: return "MessageBytes";
        case Limit::MessageDepth: return "MessageDepth";
        case Limit::HandlesPerMessage: return "HandlesPerMessage";
        case Limit::ConnectionsPerUser: return "ConnectionsPerUser";
        case Limit::MessagesInFlight: return "MessagesInFlight";
        case Limit::QueuedBytesPerReader: return "QueuedBytesPerReader";
        case Limit::ContextIdentifiersPerRequest: return "ContextIdentifiersPerRequest";
        case Limit::HelloBytes: return "HelloBytes";
        case Limit::PlanesLeased: return "PlanesLeased";
        case Limit::MessageValues: return "MessageValues";
        case Limit::HeldBytesPerUser: return "HeldBytesPerUser";
        case Limit::ConnectionsBeforeHello: return "ConnectionsBeforeHello";
        case Limit::RequestsWithoutReply: return "RequestsWithoutReply";
        case Limit::StartsWaitingForUser:
        case Limit::StartsOfApplicationWaitingForUser:
        case Limit::ArchiveBytes:
        case Limit::ArchiveDepth:
        case Limit::ExtensionsInstalled:
        case Limit::ExtensionItemsReturned:
        case Limit::ExtensionRequestsInFlight:
        case Limit::FramesAtExtension: break;
    }
    return "None";
}
/// The rows that the connections keep.
std::vector<LimitRow> limitsOfConnections() {
    std::vector<LimitRow> rows(kLimits.begin(), kLimits.end());
    std::erase_if(rows, [](const LimitRow& row) { return row.keeper != LimitKeeper::Connections; });
    return rows;
}
INSTANTIATE_TEST_SUITE_P(Row, IpcLimitTest, ::testing::ValuesIn(limitsOfConnections()), limitName);

}  // namespace
}  // namespace lumacast
