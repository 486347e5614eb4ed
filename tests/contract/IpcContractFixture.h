#pragma once
// What the tests of the transport's contract share: two or three processes, connected, and what each of them was told.

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

inline constexpr auto kService = "org.lumacast.test";

constexpr std::uint16_t id(DaemonMessage message) { return static_cast<std::uint16_t>(message); }
constexpr std::uint16_t id(ClientMessage message) { return static_cast<std::uint16_t>(message); }

/// A value that fits a declared type, with contents that show when they are cut or mixed up.
inline Value sampleFor(ArgumentType type) {
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
        case ArgumentType::Any:
        case ArgumentType::Plain: return 1.5;
    }
    return Value();
}

inline Array samplesFor(std::span<const ArgumentType> types) {
    Array values;
    for (const ArgumentType type : types) values.push_back(sampleFor(type));
    return values;
}

inline Value nested(std::uint64_t depth) {
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

}  // namespace lumacast
