// The transport: accepting connections and losing them.

#include "tests/contract/IpcContractFixture.h"

namespace lumacast {
namespace {

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

TEST_P(IpcContract, AnInvalidatedListenerAcceptsNobodyAnyMoreAndItsConnectionsLiveOn) {
    const Link l = link();
    world->on(Side::Daemon, [&] { listener->invalidate(); });
    const auto late = connect();
    EXPECT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; })) << "the name is closed";
    tell(*l.client, DaemonMessage::PauseRecording, {}, ignored);
    EXPECT_TRUE(until([&] { return daemonObject->count() == 1; }));
    EXPECT_EQ(delegate->accepted.get().size(), 1u);
    world->on(Side::Daemon, [&] {
        listener->invalidate();  // again does nothing
        listener.reset();
    });
    startListener();
    const auto next = connect();
    tell(*next, DaemonMessage::PauseRecording, {}, ignored);
    EXPECT_TRUE(until([&] { return daemonObject->count() == 2; })) << "the name is free again";
}

TEST_P(IpcContract, AnInvalidatedListenersEndpointsNameNothing) {
    std::shared_ptr<IpcEndpoint> before, after;
    world->on(Side::Daemon, [&] {
        listener = world->ipc(Side::Daemon).anonymousListener();
        listener->setDelegate(delegate);
        listener->resume();
        before = listener->endpoint();
    });
    const auto accepted = connectTo(before, Side::Client);
    tell(*accepted, DaemonMessage::PauseRecording, {}, ignored);
    ASSERT_TRUE(until([&] { return daemonObject->count() == 1; }));
    world->on(Side::Daemon, [&] {
        listener->invalidate();
        after = listener->endpoint();
    });
    const auto viaOld = connectTo(before, Side::Client), viaNew = connectTo(after, Side::Client);
    EXPECT_TRUE(until([&] { return clientLoss.invalidations.get() == 2; }));
    tell(*accepted, DaemonMessage::PauseRecording, {}, ignored);
    EXPECT_TRUE(until([&] { return daemonObject->count() == 2; })) << "what it has accepted goes on";
    EXPECT_EQ(delegate->accepted.get().size(), 1u);
}

TEST_P(IpcContract, AListenerThatIsInvalidatedBeforeItsResumeNeverAccepts) {
    std::shared_ptr<IpcEndpoint> endpoint;
    world->on(Side::Daemon, [&] {
        listener = world->ipc(Side::Daemon).anonymousListener();
        listener->setDelegate(delegate);
        endpoint = listener->endpoint();
    });
    const auto waiting = connectTo(endpoint, Side::Client);
    world->on(Side::Daemon, [&] {
        listener->invalidate();
        listener->resume();
    });
    EXPECT_TRUE(until([&] { return clientLoss.invalidations.get() == 1; }));
    EXPECT_EQ(delegate->accepted.get().size(), 0u);
}

}  // namespace
}  // namespace lumacast
