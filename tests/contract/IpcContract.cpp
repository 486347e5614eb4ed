// The transport: what may not be sent, endpoints, planes; and the worlds that its contract is judged in.

#include "tests/contract/IpcContractFixture.h"

namespace lumacast {
namespace {

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
