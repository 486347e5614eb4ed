// What every transport must do: the contract of Ipc, IpcListener, IpcConnection, IpcRemoteProxy and IpcEndpoint.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <optional>
#include <thread>

#include "base/Limits.h"
#include "base/MessageTables.h"
#include "tests/contract/IpcFakeWorld.h"
#include "tests/contract/IpcPortWorld.h"
#include "tests/contract/IpcWorld.h"

namespace lumacast {
namespace {

constexpr auto kService = "org.lumacast.test";

constexpr std::uint16_t id(DaemonMessage message) { return static_cast<std::uint16_t>(message); }
constexpr std::uint16_t id(ClientMessage message) { return static_cast<std::uint16_t>(message); }

/// A value that fits a declared type, with contents that show when they are cut or mixed up.
Value sampleFor(ArgumentType type) {
    switch (type) {
        case ArgumentType::Bool: return true;
        case ArgumentType::Int32: return Value(std::int32_t{-7});
        case ArgumentType::UInt32: return Value(std::uint32_t{4'000'000'000});
        case ArgumentType::Int64: return Value(std::int64_t{-1} << 40);
        case ArgumentType::Double: return 0.1;
        case ArgumentType::Size: return Array{640.0, 480.5};
        case ArgumentType::ContextIDs: return Array{Value(std::uint32_t{1}), Value(std::uint32_t{0xFFFFFFFF})};
        case ArgumentType::Text: return "sch\u00f6n";
        case ArgumentType::Data: return Data{0, 1, 255};
        case ArgumentType::NullableData: return Data{9};
        case ArgumentType::Dictionary:
        case ArgumentType::NullableDictionary: return Dictionary{{"b", 1}, {"a", Array{Value(), Date{2.5}}}};
        case ArgumentType::Array: return Array{"x", Dictionary{{"k", Value(std::uint64_t{1} << 63)}}};
        case ArgumentType::URL:
        case ArgumentType::NullableURL: return URL("file:///a%20b");
        case ArgumentType::NullableEndpoint: return Value();
        case ArgumentType::NullableError: return Error("domain", -5803, {{"LocalizedDescription", "no"}});
        case ArgumentType::SharedPlaneObject: return Value();
        case ArgumentType::Any: return 1.5;
    }
    return Value();
}

Array samplesFor(std::span<const ArgumentType> types) {
    Array values;
    for (const ArgumentType type : types) values.push_back(sampleFor(type));
    return values;
}

Value nested(std::uint64_t depth) {
    Value value(1);
    for (std::uint64_t i = 0; i < depth; ++i) value = Value(Array{value});
    return value;
}

class IpcContract : public ::testing::TestWithParam<IpcWorldMaker> {
protected:
    /// Two ends of one accepted connection, configured as a daemon and its client do.
    struct Link {
        std::shared_ptr<IpcConnection> client;
        std::weak_ptr<IpcConnection> daemon;
    };

    void SetUp() override {
        world = GetParam()();
        daemonObject = std::make_shared<RecordingObject>(*world, Side::Daemon);
        clientObject = std::make_shared<RecordingObject>(*world, Side::Client);
        delegate = std::make_shared<RecordingDelegate>([this](const auto& connection) {
            configureForDaemon(*connection);
            if (resumesAccepted.get()) connection->resume();
            return accepts.get();
        });
        accepts.set(true);
        resumesAccepted.set(true);
    }

    /// Waits until `condition`, evaluated here, holds.
    [[nodiscard]] bool until(const std::function<bool()>& condition) {
        const auto limit = std::chrono::steady_clock::now() + std::chrono::seconds(30);
        while (!condition()) {
            if (std::chrono::steady_clock::now() > limit) return false;
            world->settle();
        }
        return true;
    }

    void configureForDaemon(IpcConnection& connection) {
        connection.setExportedInterface(daemonProtocol());
        connection.setExportedObject(daemonObject);
        connection.setRemoteInterface(clientProtocol());
        daemonLoss.watch(connection);
    }
    void configureForClient(IpcConnection& connection) {
        connection.setExportedInterface(clientProtocol());
        connection.setExportedObject(clientObject);
        connection.setRemoteInterface(daemonProtocol());
        clientLoss.watch(connection);
    }

    void startListener(bool resumed = true) {
        world->on(Side::Daemon, [&] {
            listener = world->ipc(Side::Daemon).listenerForService(kService);
            listener->setDelegate(delegate);
            if (resumed) listener->resume();
        });
    }

    std::shared_ptr<IpcConnection> connect(Side side = Side::Client) {
        std::shared_ptr<IpcConnection> connection;
        world->on(side, [&] {
            connection = world->ipc(side).connectToService(kService);
            configureForClient(*connection);
            connection->resume();
        });
        return connection;
    }

    std::shared_ptr<IpcConnection> connectTo(const std::shared_ptr<IpcEndpoint>& endpoint, Side side) {
        std::shared_ptr<IpcConnection> connection;
        world->on(side, [&] {
            connection = world->ipc(side).connectToEndpoint(endpoint);
            configureForClient(*connection);
            connection->resume();
        });
        return connection;
    }

    Link link() {
        if (!listener) startListener();
        const std::size_t before = delegate->accepted.get().size();
        Link result;
        result.client = connect();
        EXPECT_TRUE(until([&] { return delegate->accepted.get().size() > before; }));
        result.daemon = delegate->last();
        return result;
    }

    void send(Side side, IpcConnection& connection, std::uint16_t message, Array arguments, Outcome& outcome,
              bool wantsReply) {
        world->on(side, [&] {
            connection.remoteProxy(outcome.onError())
                ->send(message, std::move(arguments), wantsReply ? outcome.onReply() : nullptr);
        });
    }
    void tell(IpcConnection& client, DaemonMessage message, Array arguments, Outcome& outcome) {
        send(Side::Client, client, id(message), std::move(arguments), outcome, false);
    }
    void ask(IpcConnection& client, DaemonMessage message, Array arguments, Outcome& outcome) {
        send(Side::Client, client, id(message), std::move(arguments), outcome, true);
    }
    /// The daemon answers questions for the state, and releases the replies of all other requests.
    void answerOnlyStates() {
        daemonObject->onMessage.set([this](const auto&, const IpcReply& reply) {
            const auto received = daemonObject->received.get();
            daemonObject->received.set({});
            if (received.back().message == id(DaemonMessage::SynchronousGetCurrentState)) reply({Value()});
        });
    }
    /// Whether a question for the state is answered, and with it all that was sent before has been looked at.
    [[nodiscard]] bool isAnswered(const Link& link) {
        Outcome outcome;
        ask(*link.client, DaemonMessage::SynchronousGetCurrentState, {}, outcome);
        return until([&] { return outcome.replyCount() + outcome.errorCount() > 0; }) && outcome.replyCount() == 1;
    }
    void tellClient(const Link& link, ClientMessage message, Array arguments, Outcome& outcome) {
        const auto daemon = link.daemon.lock();
        ASSERT_TRUE(daemon);
        send(Side::Daemon, *daemon, id(message), std::move(arguments), outcome, false);
    }

    Outcome ignored;
    std::unique_ptr<IpcWorld> world;
    std::shared_ptr<RecordingObject> daemonObject;
    std::shared_ptr<RecordingObject> clientObject;
    std::shared_ptr<RecordingDelegate> delegate;
    Shared<bool> accepts;
    Shared<bool> resumesAccepted;
    LossRecorder daemonLoss;
    LossRecorder clientLoss;
    std::shared_ptr<IpcListener> listener;

    void TearDown() override {
        // Handlers of connections that still live point here.
        listener.reset();
        world.reset();
    }
};

// --- messages and replies ---

TEST_P(IpcContract, AMessageArrivesWithItsArgumentsOnTheMainQueue) {
    const Link l = link();
    tell(*l.client, DaemonMessage::SetMicrophoneEnabled, {true}, ignored);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    const auto received = daemonObject->received.get().front();
    EXPECT_EQ(received.message, id(DaemonMessage::SetMicrophoneEnabled));
    EXPECT_EQ(received.arguments, (Array{true}));
    EXPECT_TRUE(received.wasOnMainQueue);
    EXPECT_FALSE(received.reply) << "a message without a reply comes with an empty one";
    EXPECT_EQ(received.connection.lock(), l.daemon.lock());
}

TEST_P(IpcContract, EveryMessageOfTheDaemonsProtocolTravelsAndIsAnswered) {
    const Link l = link();
    for (std::uint16_t message = 0; message < daemonProtocol().messages.size(); ++message) {
        const MessageDeclaration& declaration = daemonProtocol().messages[message];
        SCOPED_TRACE(declaration.name);
        const Array arguments = samplesFor(declaration.arguments);
        const Array values = samplesFor(declaration.replyValues);
        const bool wantsReply = declaration.reply == Reply::Expected;
        daemonObject->onMessage.set([&](const auto&, const IpcReply& reply) {
            if (reply) reply(values);
        });
        Outcome outcome;
        send(Side::Client, *l.client, message, arguments, outcome, wantsReply);
        ASSERT_TRUE(until([&] { return daemonObject->count() == message + 1u; }));
        EXPECT_EQ(daemonObject->received.get().back().message, message);
        EXPECT_EQ(daemonObject->received.get().back().arguments, arguments);
        if (wantsReply) {
            ASSERT_TRUE(until([&] { return outcome.replyCount() == 1; }));
            EXPECT_EQ(outcome.replies->get().front(), values);
        }
        EXPECT_EQ(outcome.errorCount(), 0u);
    }
}

TEST_P(IpcContract, EveryMessageOfTheClientsProtocolTravels) {
    const Link l = link();
    for (std::uint16_t message = 0; message < clientProtocol().messages.size(); ++message) {
        const MessageDeclaration& declaration = clientProtocol().messages[message];
        SCOPED_TRACE(declaration.name);
        const Array arguments = samplesFor(declaration.arguments);
        tellClient(l, static_cast<ClientMessage>(message), arguments, ignored);
        ASSERT_TRUE(until([&] { return clientObject->count() == message + 1u; }));
        EXPECT_EQ(clientObject->received.get().back().message, message);
        EXPECT_EQ(clientObject->received.get().back().arguments, arguments);
        EXPECT_TRUE(clientObject->received.get().back().wasOnMainQueue);
    }
}

TEST_P(IpcContract, MessagesArriveInTheOrderInWhichTheyWereSent) {
    const Link l = link();
    constexpr std::int32_t kCount = 1000;
    world->on(Side::Client, [&] {
        for (std::int32_t i = 0; i < kCount; ++i)
            l.client->remoteProxy(ignored.onError())->send(id(DaemonMessage::ReportCameraUsage), {Value(i)});
    });
    ASSERT_TRUE(until([&] { return daemonObject->count() == kCount; }));
    std::int32_t expected = 0;
    for (const auto& received : daemonObject->received.get())
        ASSERT_EQ(received.arguments, (Array{Value(expected++)}));
}

TEST_P(IpcContract, MessagesNearTheSizeLimitArriveWhole) {
    const Link l = link();
    Data data(limitOf(Limit::MessageBytes) - 4096);
    for (std::size_t i = 0; i < data.size(); ++i) data[i] = static_cast<std::uint8_t>(i % 251);
    const Array arguments{"host", "extension", data, Value()};
    Outcome outcome;
    daemonObject->onMessage.set([](const auto&, const IpcReply& reply) { reply({Value()}); });
    for (int i = 0; i < 3; ++i) ask(*l.client, DaemonMessage::SetupBroadcast, arguments, outcome);
    ASSERT_TRUE(until([&] { return outcome.replyCount() == 3; }));
    for (const auto& received : daemonObject->received.get()) EXPECT_TRUE(received.arguments == arguments);
}

TEST_P(IpcContract, AReplyReachesTheAskersMainQueue) {
    const Link l = link();
    daemonObject->onMessage.set([](const auto&, const IpcReply& reply) { reply({Value()}); });
    Shared<std::optional<bool>> wasOnMainQueue;
    world->on(Side::Client, [&] {
        l.client->remoteProxy({})->send(id(DaemonMessage::SynchronousGetCurrentState), {}, [&](const Array&) {
            wasOnMainQueue.set(world->isOnMainQueue(Side::Client));
        });
    });
    ASSERT_TRUE(until([&] { return wasOnMainQueue.get().has_value(); }));
    EXPECT_TRUE(*wasOnMainQueue.get());
}

TEST_P(IpcContract, RepliesMayComeLateAndInAnyOrder) {
    const Link l = link();
    Outcome first, second;
    ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, first);
    ask(*l.client, DaemonMessage::StopRecording, {}, second);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 2; }));
    world->on(Side::Daemon, [&] { daemonObject->received.get()[1].reply({URL("file:///m"), Value()}); });
    ASSERT_TRUE(until([&] { return second.replyCount() == 1; }));
    EXPECT_EQ(first.replyCount(), 0u);
    world->on(Side::Daemon, [&] { daemonObject->received.get()[0].reply({Dictionary{{"k", 1}}}); });
    ASSERT_TRUE(until([&] { return first.replyCount() == 1; }));
    EXPECT_EQ(first.replies->get().front(), (Array{Dictionary{{"k", 1}}}));
    EXPECT_EQ(second.replies->get().front(), (Array{URL("file:///m"), Value()}));
}

TEST_P(IpcContract, OnlyTheFirstReplyCounts) {
    const Link l = link();
    daemonObject->onMessage.set([](const auto&, const IpcReply& reply) {
        reply({Dictionary{{"first", true}}});
        reply({Dictionary{{"second", true}}});
    });
    Outcome outcome, after;
    ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, outcome);
    ASSERT_TRUE(until([&] { return outcome.replyCount() == 1; }));
    ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, after);
    ASSERT_TRUE(until([&] { return after.replyCount() == 1; }));
    EXPECT_EQ(outcome.replies->get(), (std::vector<Array>{{Dictionary{{"first", true}}}}));
    EXPECT_EQ(clientLoss.invalidations.get(), 0);
}

TEST_P(IpcContract, AReplyCanBeGivenFromAnotherSidesHandler) {
    const Link l = link();
    Outcome outcome;
    ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, outcome);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    world->on(Side::Other, [&] { daemonObject->received.get().front().reply({Value()}); });
    EXPECT_TRUE(until([&] { return outcome.replyCount() == 1; }));
}

TEST_P(IpcContract, AReplyAfterTheConnectionHasGoneDoesNothing) {
    const Link l = link();
    Outcome outcome;
    ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, outcome);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    world->on(Side::Client, [&] { l.client->invalidate(); });
    ASSERT_TRUE(until([&] { return daemonLoss.invalidations.get() == 1; }));
    world->on(Side::Daemon, [&] { daemonObject->received.get().front().reply({Value()}); });
    world->settle();
    EXPECT_EQ(outcome.replyCount(), 0u);
    EXPECT_EQ(outcome.errorCount(), 1u);
}

TEST_P(IpcContract, AReplyReleasedWithoutACallLeavesTheAskerWaitingUntilTheConnectionEnds) {
    const Link l = link();
    Outcome outcome;
    ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, outcome);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    daemonObject->received.set({});
    world->settle();
    EXPECT_EQ(outcome.replyCount() + outcome.errorCount(), 0u);
    world->on(Side::Daemon, [&] { l.daemon.lock()->invalidate(); });
    ASSERT_TRUE(until([&] { return outcome.errorCount() == 1; }));
    EXPECT_EQ(outcome.replyCount(), 0u);
}

TEST_P(IpcContract, ARequestWhoseReplyWasReleasedIsNotInFlightAnyMore) {
    const Link l = link();
    constexpr std::size_t kReleased = 1000;
    answerOnlyStates();
    Outcome released;
    for (std::size_t i = 1; i <= kReleased; ++i) {
        ask(*l.client, DaemonMessage::DiscardRecording, {}, released);
        if (i % 50 == 0) { ASSERT_TRUE(isAnswered(l)) << i; }
    }
    EXPECT_EQ(released.replyCount() + released.errorCount(), 0u);
    EXPECT_EQ(clientLoss.invalidations.get() + daemonLoss.invalidations.get(), 0);
    world->on(Side::Daemon, [&] { l.daemon.lock()->invalidate(); });
    ASSERT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    world->settle();
    EXPECT_EQ(released.errorCount(), kReleased) << "each is told of the loss, once";
    EXPECT_EQ(released.errors->get().back().code(), EPIPE);
    EXPECT_EQ(released.replyCount(), 0u);
}

TEST_P(IpcContract, OfTooManyRequestsWithoutAReplyTheOldestAreToldSo) {
    const Link l = link();
    constexpr std::size_t kExcess = 3;
    answerOnlyStates();
    std::vector<Outcome> outcomes(limitOf(Limit::RequestsWithoutReply) + kExcess);
    for (std::size_t i = 0; i < outcomes.size(); ++i) {
        ask(*l.client, DaemonMessage::DiscardRecording, {}, outcomes[i]);
        if (i % 50 == 0) { ASSERT_TRUE(isAnswered(l)) << i; }
    }
    for (std::size_t i = 0; i < kExcess; ++i) {
        ASSERT_TRUE(until([&] { return outcomes[i].errorCount() == 1; })) << i;
        EXPECT_EQ(outcomes[i].errors->get().front().code(), ENODATA);
    }
    ASSERT_TRUE(isAnswered(l));
    EXPECT_EQ(outcomes[kExcess].errorCount(), 0u);
    world->on(Side::Client, [&] { l.client->invalidate(); });
    ASSERT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    for (std::size_t i = 0; i < outcomes.size(); ++i) {
        ASSERT_EQ(outcomes[i].errorCount(), 1u) << i;
        EXPECT_EQ(outcomes[i].replyCount(), 0u) << i;
        EXPECT_EQ(outcomes[i].errors->get().front().code(), i < kExcess ? ENODATA : EPIPE) << i;
    }
}

TEST_P(IpcContract, ReleasingAConnectionFailsItsRequestsWithoutAReply) {
    Link l = link();
    answerOnlyStates();
    Outcome outcome;
    ask(*l.client, DaemonMessage::DiscardRecording, {}, outcome);
    ASSERT_TRUE(isAnswered(l));
    EXPECT_EQ(outcome.errorCount(), 0u);
    world->on(Side::Client, [&] { l.client.reset(); });
    EXPECT_TRUE(until([&] { return outcome.errorCount() == 1; }));
}

TEST_P(IpcContract, TheReleaseOfAReplyIsThatOfItsLastCopyOnWhateverLane) {
    const Link l = link();
    daemonObject->onMessage.set({});
    std::vector<Outcome> outcomes(limitOf(Limit::MessagesInFlight));
    for (Outcome& outcome : outcomes) ask(*l.client, DaemonMessage::DiscardRecording, {}, outcome);
    ASSERT_TRUE(until([&] { return daemonObject->count() == outcomes.size(); }));
    std::vector<IpcReply> copies;
    for (const auto& received : daemonObject->received.get()) copies.push_back(received.reply);
    daemonObject->received.set({});
    world->settle();
    Outcome excess, next;
    ask(*l.client, DaemonMessage::DiscardRecording, {}, excess);
    ASSERT_TRUE(until([&] { return excess.errorCount() == 1; })) << "a copy still lives";
    world->on(Side::Other, [&] { copies.clear(); });
    world->settle();
    daemonObject->onMessage.set([](const auto&, const IpcReply& reply) { reply({}); });
    ask(*l.client, DaemonMessage::DiscardRecording, {}, next);
    ASSERT_TRUE(until([&] { return next.replyCount() + next.errorCount() == 1; }));
    EXPECT_EQ(next.replyCount(), 1u);
    for (const Outcome& outcome : outcomes) EXPECT_EQ(outcome.errorCount() + outcome.replyCount(), 0u);
}

TEST_P(IpcContract, AReplyReleasedInsideAnotherConnectionsHandlerIsReleased) {
    const Link first = link();
    const Link second = link();
    Outcome one, two, next;
    ask(*first.client, DaemonMessage::DiscardRecording, {}, one);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    // The handlers of the other connection hold it, and go with them.
    world->on(Side::Daemon, [&] {
        auto received = daemonObject->received.get();
        daemonObject->received.set({});
        const auto held = std::make_shared<IpcReply>(std::move(received.front().reply));
        received.clear();
        const auto daemon = second.daemon.lock();
        daemon->setInterruptionHandler([held] {});
        daemon->setInvalidationHandler([this, held] { daemonLoss.invalidations.change([](int& n) { ++n; }); });
    });
    for (std::uint64_t i = 1; i < limitOf(Limit::MessagesInFlight); ++i)
        ask(*first.client, DaemonMessage::DiscardRecording, {}, two);
    ASSERT_TRUE(until([&] { return daemonObject->count() == limitOf(Limit::MessagesInFlight) - 1; }));
    Outcome excess;
    ask(*first.client, DaemonMessage::SynchronousGetCurrentState, {}, excess);
    ASSERT_TRUE(until([&] { return excess.errorCount() == 1; }));
    world->on(Side::Client, [&] { second.client->invalidate(); });
    ASSERT_TRUE(until([&] { return daemonLoss.invalidations.get() == 1; }));
    world->settle();
    daemonObject->onMessage.set([](const auto&, const IpcReply& reply) { reply({Value()}); });
    ask(*first.client, DaemonMessage::SynchronousGetCurrentState, {}, next);
    ASSERT_TRUE(until([&] { return next.replyCount() + next.errorCount() == 1; }));
    EXPECT_EQ(next.replyCount(), 1u);
    EXPECT_EQ(one.replyCount() + one.errorCount(), 0u);
}

TEST_P(IpcContract, AReplyReleasedAfterTheConnectionHasGoneDoesNothing) {
    const Link l = link();
    Outcome outcome;
    ask(*l.client, DaemonMessage::DiscardRecording, {}, outcome);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    // The daemon's end is kept, so that the release finds it.
    const auto daemon = l.daemon.lock();
    world->on(Side::Client, [&] { l.client->invalidate(); });
    ASSERT_TRUE(until([&] { return daemonLoss.invalidations.get() == 1; }));
    ASSERT_TRUE(until([&] { return outcome.errorCount() == 1; }));
    world->on(Side::Daemon, [&] { daemonObject->received.set({}); });
    world->settle();
    EXPECT_EQ(outcome.errorCount(), 1u);
    EXPECT_EQ(outcome.replyCount(), 0u);
    EXPECT_EQ(daemonLoss.invalidations.get(), 1);
}

TEST_P(IpcContract, ARequestThatNobodyReceivesIsNotInFlightAnyMore) {
    const Link l = link();
    world->on(Side::Daemon, [&] { daemonObject.reset(); });
    Outcome unheard;
    const auto ping = [&] {
        // A frame of the daemon's own shows that it has looked at all that was sent before.
        const std::size_t before = clientObject->count();
        tellClient(l, ClientMessage::UpdateScreenRecordingState, {true}, ignored);
        return until([&] { return clientObject->count() > before; });
    };
    for (std::uint64_t i = 0; i < 3 * limitOf(Limit::MessagesInFlight); ++i) {
        ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, unheard);
        if (i % 16 == 0) {
            world->settle();
            ASSERT_TRUE(ping());
        }
    }
    world->settle();
    EXPECT_EQ(unheard.errorCount() + unheard.replyCount(), 0u);
    daemonObject = std::make_shared<RecordingObject>(*world, Side::Daemon);
    answerOnlyStates();
    world->on(Side::Daemon, [&] { l.daemon.lock()->setExportedObject(daemonObject); });
    EXPECT_TRUE(isAnswered(l));
}

TEST_P(IpcContract, MessagesCanBeSentFromWithinAMessageAndAReply) {
    const Link l = link();
    daemonObject->onMessage.set([&](const auto& connection, const IpcReply& reply) {
        connection->remoteProxy({})->send(id(ClientMessage::UpdateScreenRecordingState), {true});
        if (reply) reply({Value()});
    });
    Shared<bool> done;
    world->on(Side::Client, [&] {
        l.client->remoteProxy({})->send(id(DaemonMessage::SynchronousGetCurrentState), {}, [&](const Array&) {
            l.client->remoteProxy({})->send(id(DaemonMessage::SynchronousGetCurrentState), {},
                                            [&](const Array&) { done.set(true); });
        });
    });
    ASSERT_TRUE(until([&] { return done.get(); }));
    EXPECT_TRUE(until([&] { return clientObject->count() == 2; }));
}

// --- accepting ---

TEST_P(IpcContract, NothingIsAcceptedBeforeTheListenerIsResumed) {
    startListener(false);
    const auto client = connect();
    tell(*client, DaemonMessage::PauseRecording, {}, ignored);
    world->settle();
    EXPECT_TRUE(delegate->accepted.get().empty());
    world->on(Side::Daemon, [&] { listener->resume(); });
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    EXPECT_EQ(delegate->accepted.get().size(), 1u);
}

TEST_P(IpcContract, TheDelegateIsAskedOnTheMainQueue) {
    Shared<std::optional<bool>> wasOnMainQueue;
    delegate = std::make_shared<RecordingDelegate>([&](const auto&) {
        wasOnMainQueue.set(world->isOnMainQueue(Side::Daemon));
        return false;
    });
    startListener();
    const auto client = connect();
    ASSERT_TRUE(until([&] { return wasOnMainQueue.get().has_value(); }));
    EXPECT_TRUE(*wasOnMainQueue.get());
}

TEST_P(IpcContract, ARefusedConnectionEndsForItsPeer) {
    accepts.set(false);
    startListener();
    const auto client = connect();
    Outcome outcome;
    ask(*client, DaemonMessage::SynchronousGetCurrentState, {}, outcome);
    ASSERT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    EXPECT_TRUE(until([&] { return outcome.errorCount() == 1; }));
    EXPECT_EQ(daemonObject->count(), 0u);
    EXPECT_TRUE(until([&] { return delegate->last() == nullptr; })) << "nobody owns a refused connection";
}

TEST_P(IpcContract, AConnectionIsRefusedWhenTheDelegateHasGone) {
    startListener();
    delegate.reset();
    const auto client = connect();
    EXPECT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
}

TEST_P(IpcContract, WhatArrivedBeforeAConnectionIsResumedIsDeliveredThen) {
    resumesAccepted.set(false);
    const Link l = link();
    tell(*l.client, DaemonMessage::SetMicrophoneEnabled, {true}, ignored);
    tell(*l.client, DaemonMessage::SetMicrophoneEnabled, {false}, ignored);
    world->settle();
    EXPECT_EQ(daemonObject->count(), 0u);
    world->on(Side::Daemon, [&] { l.daemon.lock()->resume(); });
    ASSERT_TRUE(until([&] { return daemonObject->count() == 2; }));
    EXPECT_EQ(daemonObject->received.get()[0].arguments, (Array{true}));
}

TEST_P(IpcContract, TheListenerRoleOwnsAnAcceptedConnectionUntilItIsLost) {
    const Link l = link();
    world->settle();
    ASSERT_FALSE(l.daemon.expired());
    world->on(Side::Client, [&] { l.client->invalidate(); });
    EXPECT_TRUE(until([&] { return l.daemon.expired(); }));
    EXPECT_EQ(daemonLoss.invalidations.get(), 1);
}

TEST_P(IpcContract, AcceptedConnectionsLiveOnWhenTheirListenerIsDestroyed) {
    const Link l = link();
    world->on(Side::Daemon, [&] { listener.reset(); });
    tell(*l.client, DaemonMessage::PauseRecording, {}, ignored);
    EXPECT_TRUE(until([&] { return daemonObject->count() == 1; }));
    const auto late = connect();
    EXPECT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; })) << "the name is closed";
    startListener();
    const auto next = connect();
    tell(*next, DaemonMessage::PauseRecording, {}, ignored);
    EXPECT_TRUE(until([&] { return daemonObject->count() == 2; })) << "the name is free again";
}

TEST_P(IpcContract, ASecondListenerOnANameInUseAcceptsNobodyAndLeavesTheFirstInPeace) {
    startListener();
    std::shared_ptr<IpcListener> second;
    world->on(Side::Other, [&] {
        second = world->ipc(Side::Other).listenerForService(kService);
        ASSERT_TRUE(second);
        second->setDelegate(delegate);
        second->resume();
        second.reset();
    });
    const Link l = link();
    tell(*l.client, DaemonMessage::PauseRecording, {}, ignored);
    EXPECT_TRUE(until([&] { return daemonObject->count() == 1; }));
}

TEST_P(IpcContract, AConnectionToAServiceNobodyServesIsLostOnceItIsResumed) {
    std::shared_ptr<IpcConnection> connection;
    world->on(Side::Client, [&] {
        connection = world->ipc(Side::Client).connectToService("org.lumacast.nobody");
        ASSERT_TRUE(connection);
        configureForClient(*connection);
    });
    Outcome outcome;
    ask(*connection, DaemonMessage::SynchronousGetCurrentState, {}, outcome);
    world->settle();
    EXPECT_EQ(clientLoss.invalidations.get(), 0);
    world->on(Side::Client, [&] {
        connection->resume();
        EXPECT_EQ(clientLoss.invalidations.get(), 0) << "not inline";
    });
    ASSERT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    EXPECT_TRUE(until([&] { return outcome.errorCount() == 1; }));
    EXPECT_EQ(outcome.replyCount(), 0u);
}

TEST_P(IpcContract, EachEndKnowsTheProcessOfTheOther) {
    const Link l = link();
    EXPECT_EQ(l.client->processIdentifier(), world->pid(Side::Daemon));
    EXPECT_EQ(l.daemon.lock()->processIdentifier(), world->pid(Side::Client));
    world->on(Side::Client, [&] { l.client->invalidate(); });
    ASSERT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    EXPECT_EQ(l.client->processIdentifier(), world->pid(Side::Daemon)) << "fixed at birth";
}

TEST_P(IpcContract, EntitlementsAreWhatTheAdministratorGranted) {
    world->grant(Side::Daemon, "org.lumacast.granted", Value(true));
    const Link l = link();
    EXPECT_EQ(l.daemon.lock()->valueForEntitlement("org.lumacast.granted"), std::optional(Value(true)));
    EXPECT_EQ(l.daemon.lock()->valueForEntitlement("org.lumacast.other"), std::nullopt);
}

// --- loss ---

TEST_P(IpcContract, TheLossOfThePeerIsReportedOnceAndAsInvalidation) {
    const Link l = link();
    world->on(Side::Client, [&] { l.client->invalidate(); });
    ASSERT_TRUE(until([&] { return daemonLoss.invalidations.get() == 1; }));
    world->settle();
    EXPECT_EQ(daemonLoss.invalidations.get(), 1);
    EXPECT_EQ(daemonLoss.interruptions.get(), 0);
}

TEST_P(IpcContract, InvalidateCallsTheOwnHandlerLaterAndOnce) {
    const Link l = link();
    world->on(Side::Client, [&] {
        l.client->invalidate();
        l.client->invalidate();
        EXPECT_EQ(clientLoss.invalidations.get(), 0) << "not inline";
    });
    ASSERT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    world->on(Side::Client, [&] { l.client->invalidate(); });
    world->settle();
    EXPECT_EQ(clientLoss.invalidations.get(), 1);
    EXPECT_EQ(clientLoss.interruptions.get(), 0);
}

TEST_P(IpcContract, AConnectionCanBeInvalidatedBeforeItIsResumed) {
    startListener();
    world->on(Side::Client, [&] {
        const auto connection = world->ipc(Side::Client).connectToService(kService);
        configureForClient(*connection);
        connection->invalidate();
        connection->resume();
    });
    EXPECT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    world->settle();
    EXPECT_EQ(clientLoss.invalidations.get(), 1);
}

TEST_P(IpcContract, TheHandlerThatIsSetWhenTheLossIsDeliveredIsTheOneCalled) {
    const Link l = link();
    Shared<int> replaced;
    world->on(Side::Client, [&] {
        l.client->invalidate();
        l.client->setInvalidationHandler([&] { replaced.change([](int& n) { ++n; }); });
    });
    ASSERT_TRUE(until([&] { return replaced.get() == 1; }));
    EXPECT_EQ(clientLoss.invalidations.get(), 0);
}

TEST_P(IpcContract, AHandlerThatWasTakenAwayIsNotCalled) {
    const Link l = link();
    world->on(Side::Client, [&] {
        l.client->invalidate();
        l.client->setInvalidationHandler({});
    });
    world->settle();
    EXPECT_EQ(clientLoss.invalidations.get(), 0);
}

TEST_P(IpcContract, AHandlerMayDoAnythingToItsConnection) {
    const Link l = link();
    Shared<int> calls;
    Outcome outcome;
    world->on(Side::Client, [&] {
        l.client->setInvalidationHandler([&, connection = std::weak_ptr(l.client)] {
            const auto self = connection.lock();
            self->setInvalidationHandler([&] { calls.change([](int& n) { n += 100; }); });
            self->invalidate();
            self->resume();
            self->remoteProxy(outcome.onError())->send(id(DaemonMessage::PauseRecording), {});
            calls.change([](int& n) { ++n; });
        });
        l.client->invalidate();
    });
    ASSERT_TRUE(until([&] { return outcome.errorCount() == 1; }));
    world->settle();
    EXPECT_EQ(calls.get(), 1);
}

TEST_P(IpcContract, AHandlerMayReleaseItsConnection) {
    const Link l = link();
    Shared<bool> released;
    auto kept = std::make_shared<std::shared_ptr<IpcConnection>>(connect());
    world->on(Side::Client, [&] {
        (*kept)->setInvalidationHandler([&released, kept] {
            kept->reset();
            released.set(true);
        });
        (*kept)->invalidate();
    });
    EXPECT_TRUE(until([&] { return released.get(); }));
}

TEST_P(IpcContract, RequestsThatWaitForAReplyFailOnceWhenTheConnectionIsLost) {
    const Link l = link();
    Outcome first, second;
    ask(*l.client, DaemonMessage::StopRecording, {}, first);
    ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, second);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 2; }));
    world->on(Side::Daemon, [&] { l.daemon.lock()->invalidate(); });
    ASSERT_TRUE(until([&] { return first.errorCount() == 1 && second.errorCount() == 1; }));
    ASSERT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    world->settle();
    EXPECT_EQ(first.errorCount() + second.errorCount(), 2u);
    EXPECT_EQ(first.replyCount() + second.replyCount(), 0u);
}

TEST_P(IpcContract, ReleasingAConnectionEndsItForThePeerAndFailsItsRequests) {
    Link l = link();
    Outcome outcome;
    ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, outcome);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    world->on(Side::Client, [&] { l.client.reset(); });
    EXPECT_TRUE(until([&] { return daemonLoss.invalidations.get() == 1; }));
    EXPECT_TRUE(until([&] { return outcome.errorCount() == 1; }));
}

TEST_P(IpcContract, SendingAfterTheLossCallsTheErrorHandlerLater) {
    const Link l = link();
    world->on(Side::Client, [&] { l.client->invalidate(); });
    ASSERT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    Outcome outcome;
    Shared<std::optional<bool>> wasOnMainQueue;
    world->on(Side::Client, [&] {
        l.client
            ->remoteProxy([&](const Error& error) {
                wasOnMainQueue.set(world->isOnMainQueue(Side::Client));
                outcome.onError()(error);
            })
            ->send(id(DaemonMessage::SynchronousGetCurrentState), {}, outcome.onReply());
        EXPECT_EQ(outcome.errorCount(), 0u) << "not inline";
    });
    ASSERT_TRUE(until([&] { return outcome.errorCount() == 1; }));
    EXPECT_TRUE(*wasOnMainQueue.get());
    EXPECT_EQ(outcome.errors->get().front().domain(), kSystemErrorDomain);
    EXPECT_EQ(outcome.replyCount(), 0u);
}

TEST_P(IpcContract, WhatWasSentBeforeInvalidateStillArrives) {
    const Link l = link();
    world->on(Side::Daemon, [&] {
        const auto daemon = l.daemon.lock();
        for (int i = 0; i < 100; ++i)
            daemon->remoteProxy({})->send(id(ClientMessage::UpdateScreenRecordingState), {i % 2 == 0});
        daemon->invalidate();
    });
    ASSERT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    EXPECT_EQ(clientObject->count(), 100u);
}

TEST_P(IpcContract, AfterInvalidateFromWithinAMessageNoFurtherOneIsDelivered) {
    const Link l = link();
    daemonObject->onMessage.set([](const auto& connection, const IpcReply&) { connection->invalidate(); });
    world->on(Side::Client, [&] {
        for (int i = 0; i < 10; ++i) l.client->remoteProxy({})->send(id(DaemonMessage::PauseRecording), {});
    });
    ASSERT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    ASSERT_TRUE(until([&] { return daemonLoss.invalidations.get() == 1; }));
    EXPECT_EQ(daemonObject->count(), 1u);
}

TEST_P(IpcContract, TheExportedObjectIsHeldWeakly) {
    const Link l = link();
    const std::weak_ptr<RecordingObject> weak = daemonObject;
    world->on(Side::Daemon, [&] { daemonObject.reset(); });
    EXPECT_TRUE(weak.expired());
    tell(*l.client, DaemonMessage::PauseRecording, {}, ignored);
    world->settle();
    EXPECT_EQ(clientLoss.invalidations.get(), 0) << "a message without a receiver is no fault of the peer";
    daemonObject = std::make_shared<RecordingObject>(*world, Side::Daemon);
    world->on(Side::Daemon, [&] { l.daemon.lock()->setExportedObject(daemonObject); });
    tell(*l.client, DaemonMessage::ResumeRecording, {Value(std::uint32_t{1})}, ignored);
    // The first message may have been on its way still when there was a receiver again.
    ASSERT_TRUE(until([&] {
        const auto received = daemonObject->received.get();
        return !received.empty() && received.back().message == id(DaemonMessage::ResumeRecording);
    }));
}

// --- what may not be sent ---

TEST_P(IpcContract, AMessageThatIsNotWhatTheTableDeclaresFailsAtTheSender) {
    const Link l = link();
    Outcome outcome;
    tell(*l.client, DaemonMessage::SetMicrophoneEnabled, {1}, outcome);
    tell(*l.client, DaemonMessage::SetMicrophoneEnabled, {}, outcome);
    tell(*l.client, DaemonMessage::SetBroadcastURL, {"text"}, outcome);
    send(Side::Client, *l.client, 20, {}, outcome, false);
    ASSERT_TRUE(until([&] { return outcome.errorCount() == 4; }));
    tell(*l.client, DaemonMessage::SetMicrophoneEnabled, {true}, outcome);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    EXPECT_EQ(outcome.errorCount(), 4u);
}

TEST_P(IpcContract, AMessageOverALimitFailsAtTheSenderAndTheConnectionStays) {
    const Link l = link();
    const auto setup = [](Value userInfo) { return Array{"h", "e", Data{}, Dictionary{{"k", std::move(userInfo)}}}; };
    Outcome deep, big, ok;
    ask(*l.client, DaemonMessage::SetupBroadcast, setup(nested(limitOf(Limit::MessageDepth))), deep);
    ask(*l.client, DaemonMessage::SetupBroadcast, setup(Data(limitOf(Limit::MessageBytes))), big);
    Array endpoints;
    world->on(Side::Client, [&] {
        const auto anonymous = world->ipc(Side::Client).anonymousListener();
        for (std::uint64_t i = 0; i <= limitOf(Limit::HandlesPerMessage); ++i)
            endpoints.push_back(anonymous->endpoint());
    });
    Outcome handles;
    ask(*l.client, DaemonMessage::SetupBroadcast, setup(endpoints), handles);
    ASSERT_TRUE(until([&] { return deep.errorCount() == 1 && big.errorCount() == 1 && handles.errorCount() == 1; }));
    daemonObject->onMessage.set([](const auto&, const IpcReply& reply) { reply({Value()}); });
    ask(*l.client, DaemonMessage::SetupBroadcast, setup(nested(limitOf(Limit::MessageDepth) - 3)), ok);
    EXPECT_TRUE(until([&] { return ok.replyCount() == 1; }));
    EXPECT_EQ(daemonObject->count(), 1u);
}

TEST_P(IpcContract, AReplyOverALimitReachesTheAskerAsAnError) {
    const Link l = link();
    daemonObject->onMessage.set([](const auto&, const IpcReply& reply) {
        reply({Data(limitOf(Limit::MessageBytes)), Value()});
    });
    Outcome outcome;
    ask(*l.client, DaemonMessage::GetCurrentBroadcastImages, {}, outcome);
    ASSERT_TRUE(until([&] { return outcome.errorCount() == 1; }));
    EXPECT_EQ(outcome.replyCount(), 0u);
    EXPECT_EQ(clientLoss.invalidations.get(), 0);
}

TEST_P(IpcContract, OnlySoManyRequestsMayWaitForTheirReply) {
    const Link l = link();
    std::vector<Outcome> outcomes(limitOf(Limit::MessagesInFlight));
    for (Outcome& outcome : outcomes) ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, outcome);
    Outcome excess;
    ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, excess);
    ASSERT_TRUE(until([&] { return excess.errorCount() == 1; }));
    ASSERT_TRUE(until([&] { return daemonObject->count() == outcomes.size(); }));
    world->on(Side::Daemon, [&] { daemonObject->received.get().front().reply({Value()}); });
    ASSERT_TRUE(until([&] { return outcomes.front().replyCount() == 1; }));
    Outcome next;
    ask(*l.client, DaemonMessage::SynchronousGetCurrentState, {}, next);
    ASSERT_TRUE(until([&] { return daemonObject->count() == outcomes.size() + 1; }));
    world->settle();
    EXPECT_EQ(next.errorCount(), 0u);
    EXPECT_EQ(clientLoss.invalidations.get(), 0);
}

TEST_P(IpcContract, SendingToAPeerThatDoesNotReadFailsAtTheLimitAndLosesNothingThatWasTaken) {
    resumesAccepted.set(false);
    const Link l = link();
    const Array arguments{"h", "e", Data(limitOf(Limit::MessageBytes) / 2), Value()};
    std::vector<Outcome> outcomes(2 * limitOf(Limit::QueuedBytesPerReader) / limitOf(Limit::MessageBytes) * 2);
    for (Outcome& outcome : outcomes) ask(*l.client, DaemonMessage::SetupBroadcast, arguments, outcome);
    ASSERT_TRUE(until([&] { return outcomes.back().errorCount() == 1; })) << "the queue is bounded";
    daemonObject->onMessage.set([](const auto&, const IpcReply& reply) { reply({Value()}); });
    world->on(Side::Daemon, [&] { l.daemon.lock()->resume(); });
    for (Outcome& outcome : outcomes)
        ASSERT_TRUE(until([&] { return outcome.errorCount() + outcome.replyCount() == 1; }));
    EXPECT_EQ(outcomes.front().replyCount(), 1u);
    EXPECT_EQ(clientLoss.invalidations.get(), 0);
}

// --- endpoints ---

TEST_P(IpcContract, AnEndpointConnectsToItsAnonymousListener) {
    std::shared_ptr<IpcEndpoint> endpoint;
    world->on(Side::Daemon, [&] {
        listener = world->ipc(Side::Daemon).anonymousListener();
        listener->setDelegate(delegate);
        listener->resume();
        endpoint = listener->endpoint();
    });
    const auto connection = connectTo(endpoint, Side::Daemon);
    tell(*connection, DaemonMessage::PauseRecording, {}, ignored);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    EXPECT_EQ(connection->processIdentifier(), world->pid(Side::Daemon));
    EXPECT_EQ(delegate->last()->processIdentifier(), world->pid(Side::Daemon));
}

TEST_P(IpcContract, AnEndpointTravelsAndCanBeForwardedAndUsedManyTimes) {
    // The daemon makes a listener and sends its endpoint to a client, which forwards it to a third process.
    const Link l = link();
    std::shared_ptr<IpcListener> anonymous;
    const auto anonymousObject = std::make_shared<RecordingObject>(*world, Side::Daemon);
    const auto anonymousDelegate = std::make_shared<RecordingDelegate>([&](const auto& connection) {
        connection->setExportedInterface(daemonProtocol());
        connection->setExportedObject(anonymousObject);
        connection->resume();
        return true;
    });
    Value endpoint;
    world->on(Side::Daemon, [&] {
        anonymous = world->ipc(Side::Daemon).anonymousListener();
        anonymous->setDelegate(anonymousDelegate);
        anonymous->resume();
        endpoint = Value(anonymous->endpoint());
    });
    const auto received = [&](const RecordingObject& object) {
        return *object.received.get().back().arguments.front().as<Value::EndpointRef>();
    };
    tellClient(l, ClientMessage::RecordingLockInterrupted, {endpoint}, ignored);
    ASSERT_TRUE(until([&] { return clientObject->count() == 1; }));
    endpoint = Value();
    const auto atClient = received(*clientObject);
    ASSERT_TRUE(atClient);

    // Forwarded from the client to the third process over a connection between the two.
    std::shared_ptr<IpcListener> clientListener;
    Link onward;
    const auto onwardDelegate = std::make_shared<RecordingDelegate>([&](const auto& connection) {
        connection->setRemoteInterface(clientProtocol());
        connection->resume();
        return true;
    });
    world->on(Side::Client, [&] {
        clientListener = world->ipc(Side::Client).listenerForService("org.lumacast.onward");
        clientListener->setDelegate(onwardDelegate);
        clientListener->resume();
    });
    const auto otherObject = std::make_shared<RecordingObject>(*world, Side::Other);
    std::shared_ptr<IpcConnection> other;
    world->on(Side::Other, [&] {
        other = world->ipc(Side::Other).connectToService("org.lumacast.onward");
        other->setExportedInterface(clientProtocol());
        other->setExportedObject(otherObject);
        other->resume();
    });
    ASSERT_TRUE(until([&] { return onwardDelegate->last() != nullptr; }));
    send(Side::Client, *onwardDelegate->last(), id(ClientMessage::RecordingLockInterrupted), {Value(atClient)}, ignored,
         false);
    ASSERT_TRUE(until([&] { return otherObject->count() == 1; }));

    const auto fromClient = connectTo(atClient, Side::Client);
    const auto fromOther = connectTo(received(*otherObject), Side::Other);
    const auto again = connectTo(received(*otherObject), Side::Other);
    for (const auto& connection : {fromClient, fromOther, again})
        tell(*connection, DaemonMessage::PauseRecording, {}, ignored);
    EXPECT_TRUE(until([&] { return anonymousObject->count() == 3; }));
    EXPECT_EQ(fromOther->processIdentifier(), world->pid(Side::Daemon));
}

TEST_P(IpcContract, AnEndpointsConnectionWaitsForTheListenersResume) {
    std::shared_ptr<IpcEndpoint> endpoint;
    world->on(Side::Daemon, [&] {
        listener = world->ipc(Side::Daemon).anonymousListener();
        listener->setDelegate(delegate);
        endpoint = listener->endpoint();
    });
    const auto connection = connectTo(endpoint, Side::Client);
    tell(*connection, DaemonMessage::PauseRecording, {}, ignored);
    world->settle();
    EXPECT_EQ(daemonObject->count(), 0u);
    world->on(Side::Daemon, [&] { listener->resume(); });
    EXPECT_TRUE(until([&] { return daemonObject->count() == 1; }));
}

TEST_P(IpcContract, AnEndpointDiesWithItsListener) {
    std::shared_ptr<IpcEndpoint> endpoint;
    world->on(Side::Daemon, [&] {
        auto anonymous = world->ipc(Side::Daemon).anonymousListener();
        anonymous->setDelegate(delegate);
        anonymous->resume();
        endpoint = anonymous->endpoint();
    });
    const auto connection = connectTo(endpoint, Side::Client);
    EXPECT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    EXPECT_EQ(delegate->accepted.get().size(), 0u);
}

TEST_P(IpcContract, ConnectingToNoEndpointIsLostOnceItIsResumed) {
    const auto connection = connectTo(nullptr, Side::Client);
    EXPECT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
}

// --- shared planes ---

TEST_P(IpcContract, APlaneArrivesWithItsPictureAndItsDamage) {
    const Link l = link();
    const auto plane = std::make_shared<PlainPlane>(33, 17, std::vector<PixelRect>{{1, 2, 3, 4}, {0, 0, 33, 17}}, 42);
    tellClient(l, ClientMessage::CaptureHandlerWithSample, {Value(Value::PlaneRef(plane)), Data{1}}, ignored);
    ASSERT_TRUE(until([&] { return clientObject->count() == 1; }));
    const auto arguments = clientObject->received.get().front().arguments;
    const auto* received = arguments[0].as<Value::PlaneRef>();
    ASSERT_TRUE(received);
    EXPECT_EQ((*received)->width(), 33);
    EXPECT_EQ((*received)->height(), 17);
    EXPECT_EQ((*received)->stride(), plane->stride());
    EXPECT_EQ((*received)->pictureNumber(), 42u);
    EXPECT_THAT((*received)->damage(), ::testing::ElementsAreArray(plane->damage()));
    EXPECT_THAT((*received)->pixels(), ::testing::ElementsAreArray(plane->pixels()));
}

TEST_P(IpcContract, AFrameWithoutAPlaneArrives) {
    const Link l = link();
    tellClient(l, ClientMessage::CaptureHandlerWithSample, {Value(), Data{1}}, ignored);
    ASSERT_TRUE(until([&] { return clientObject->count() == 1; }));
    EXPECT_EQ(clientObject->received.get().front().arguments, (Array{Value(), Data{1}}));
}

TEST_P(IpcContract, ALentPlaneIsHeldUntilItsReceiverLetsGoOfIt) {
    const Link l = link();
    auto plane = std::make_shared<PlainPlane>(8, 8);
    const std::weak_ptr<PlainPlane> weak = plane;
    tellClient(l, ClientMessage::CaptureHandlerWithSample, {Value(Value::PlaneRef(plane)), Data{}}, ignored);
    plane.reset();
    ASSERT_TRUE(until([&] { return clientObject->count() == 1; }));
    world->settle();
    EXPECT_FALSE(weak.expired());
    clientObject->received.set({});
    EXPECT_TRUE(until([&] { return weak.expired(); }));
}

TEST_P(IpcContract, LentPlanesAreFreeWhenTheirHolderIsLost) {
    const Link l = link();
    auto plane = std::make_shared<PlainPlane>(8, 8);
    const std::weak_ptr<PlainPlane> weak = plane;
    tellClient(l, ClientMessage::CaptureHandlerWithSample, {Value(Value::PlaneRef(plane)), Data{}}, ignored);
    plane.reset();
    ASSERT_TRUE(until([&] { return clientObject->count() == 1; }));
    world->on(Side::Client, [&] { l.client->invalidate(); });
    EXPECT_TRUE(until([&] { return weak.expired(); }));
    const auto arguments = clientObject->received.get().front().arguments;
    EXPECT_EQ((*arguments[0].as<Value::PlaneRef>())->pixels().size(), (8 * 4 + 16) * 8u) << "the receiver's copy stays";
}

TEST_P(IpcContract, OnlySoManyPlanesAreLentToOnePeer) {
    const Link l = link();
    const auto sendFrame = [&](Outcome& outcome) {
        tellClient(l, ClientMessage::CaptureHandlerWithSample,
                   {Value(Value::PlaneRef(std::make_shared<PlainPlane>(8, 8))), Data{}}, outcome);
    };
    for (std::uint64_t i = 0; i < limitOf(Limit::PlanesLeased); ++i) sendFrame(ignored);
    Outcome excess;
    sendFrame(excess);
    ASSERT_TRUE(until([&] { return excess.errorCount() == 1; }));
    ASSERT_TRUE(until([&] { return clientObject->count() == limitOf(Limit::PlanesLeased); }));
    clientObject->received.change([](auto& list) { list.pop_back(); });
    EXPECT_TRUE(until([&] {
        Outcome next;
        const std::size_t before = clientObject->count();
        sendFrame(next);
        world->settle();
        return clientObject->count() > before && next.errorCount() == 0;
    })) << "a plane given back makes room";
    EXPECT_EQ(clientLoss.invalidations.get(), 0);
}

INSTANTIATE_TEST_SUITE_P(Fake, IpcContract, ::testing::Values([]() -> std::unique_ptr<IpcWorld> {
                             return std::make_unique<IpcFakeWorld<SimScheduler>>(std::uint64_t{1});
                         }));
INSTANTIATE_TEST_SUITE_P(FakeOnThreads, IpcContract, ::testing::Values([]() -> std::unique_ptr<IpcWorld> {
                             return std::make_unique<IpcFakeWorld<ThreadScheduler>>(std::make_shared<ThreadLoop>());
                         }));
INSTANTIATE_TEST_SUITE_P(Port, IpcContract, ::testing::Values([]() -> std::unique_ptr<IpcWorld> {
                             return std::make_unique<IpcPortWorld>();
                         }));

}  // namespace
}  // namespace lumacast
