// Start-up, connections and the registry.

#include "daemon/LCRecordingManager.h"

#include <algorithm>

#include "daemon/LCClientProxy.h"

namespace lumacast {

namespace {

constexpr char kServiceName[] = "com.orvane.lumacastd";

}  // namespace

LCRecordingManager::LCRecordingManager(const SessionServices& services, AlertQueue& alertQueue)
    : services_(services), platform_(services.platform), log_(services.platform.log), alertQueue_(alertQueue) {}

LCRecordingManager::~LCRecordingManager() {
    if (!layoutMonitor_) return;
    layoutMonitor_->removeObserver(*this);
    layoutMonitor_->invalidate();
}

std::shared_ptr<LCRecordingManager> LCRecordingManager::init(const SessionServices& services, AlertQueue& alertQueue,
                                                             SessionMaker makeSession) {
    std::shared_ptr<LCRecordingManager> manager(new LCRecordingManager(services, alertQueue));
    manager->makeSession_ = std::move(makeSession);
    services.tempStore._srSetupTempDirectory();
    manager->publicListener_ = services.platform.ipc.listenerForService(kServiceName);
    manager->publicListener_->setDelegate(manager);
    manager->registerPurgeCallbacks();  // last
    return manager;
}

void LCRecordingManager::finishStartup() { publicListener_->resume(); }

bool LCRecordingManager::listenerShouldAcceptNewConnection(IpcListener&,
                                                           const std::shared_ptr<IpcConnection>& connection) {
    log_.line("LCRecordingManager: shouldAcceptNewConnection:");
    const ProcessID pid = connection->processIdentifier();
    if (pid == ProcessID{0}) return false;
    const auto bundleID = bundleIDOfProcess(pid);
    if (!bundleID) {
        log_.error("process %d belongs to no known application; its connection is refused", pid);
        return false;
    }
    log_.line("accepted client connection PID: %d", pid);
    connection->setExportedObject(weak_from_this());
    connection->setExportedInterface(daemonProtocol());
    connection->setRemoteInterface(clientProtocol());
    // Weak: the registry holds the connection.
    connection->setInterruptionHandler([weak = weak_from_this(), id = *bundleID] {
        const auto self = weak.lock();
        if (!self) return;
        self->log_.line("connection INTERRUPTED");
        self->applicationDisconnectedWithBundleID(id);
    });
    connection->setInvalidationHandler([weak = weak_from_this(), id = *bundleID] {
        const auto self = weak.lock();
        if (!self) return;
        self->log_.line("connection INVALID");
        self->applicationDisconnectedWithBundleID(id);
    });
    const auto session = recordingSessionForBundleID(*bundleID);
    if (const auto proxy = session->clientProxy()) {
        if (const auto old = proxy->connection()) {
            // Without its handlers, so that retiring it does not tear the session down.
            old->setInvalidationHandler({});
            old->setInterruptionHandler({});
            old->invalidate();
            proxy->setConnection(nullptr);
        }
    }
    session->setClientProxy(std::make_shared<LCClientProxy>(log_, *bundleID, connection));
    session->managerRecord.connection = connection;
    session->endWaitForExtension();
    cancelOrphanedQuestions();
    connection->resume();
    expireAcknowledgementExemptionsForBundleID(*bundleID);
    return true;
}

void LCRecordingManager::applicationDisconnectedWithBundleID(const BundleIdentifier& bundleID) {
    log_.line("LCRecordingManager: applicationDisconnected");
    const auto session = registeredSession(bundleID);
    if (!session) return;
    session->endWaitForExtension();
    if (session->isSystemRecording() && !session->isDead()) {
        // A system recording deliberately goes on without its client, and its session stays when it has ended.
        if (const auto proxy = session->clientProxy()) proxy->setConnection(nullptr);
        cancelOrphanedQuestions();
        return;
    }
    stopRecordingSession(session, 0, 0, {});
    removeSessionForBundleID(bundleID);
    cancelOrphanedQuestions();
    resetUnansweredStops(session);
}

std::optional<BundleIdentifier> LCRecordingManager::bundleIDOfProcess(ProcessID pid) {
    const auto bundle = services_.localization.bundleWithPID(pid);
    auto identifier = bundle ? bundle->identifier() : std::nullopt;
    return identifier && !identifier->text().empty() ? identifier : std::nullopt;
}

std::optional<BundleIdentifier> LCRecordingManager::getCallingConnectionBundleID() {
    return callingConnection_ ? bundleIDOfProcess(callingConnection_->processIdentifier()) : std::nullopt;
}

std::shared_ptr<LCRecordingSession> LCRecordingManager::getCallingConnectionRecordingSession() {
    const auto bundleID = getCallingConnectionBundleID();
    return bundleID ? registeredSession(*bundleID) : nullptr;
}

std::shared_ptr<LCRecordingSession> LCRecordingManager::registeredSession(const BundleIdentifier& bundleID) const {
    for (const auto& [id, session] : bundleIDToRecordingSessionLookup_)
        if (id == bundleID) return session;
    return nullptr;
}

std::shared_ptr<LCRecordingSession> LCRecordingManager::recordingSessionForBundleID(const BundleIdentifier& bundleID) {
    log_.line("LCRecordingManager:recordingSessionForBundleID");
    if (auto session = registeredSession(bundleID)) {
        // One that can't deliver anything any more is kept for nobody.
        const auto proxy = session->clientProxy();
        const bool isOver = session->isDead() && !session->isRecording() && proxy && !proxy->connection();
        if (!isOver) return session;
        removeSessionForBundleID(bundleID);
    }
    log_.line("no session, creating a new one");
    auto session = makeSession_ ? makeSession_(services_, bundleID)
                                : std::make_shared<LCRecordingSession>(services_, bundleID);
    bundleIDToRecordingSessionLookup_.emplace_back(bundleID, session);
    return session;
}

void LCRecordingManager::removeSessionForBundleID(const BundleIdentifier& bundleID) {
    log_.line("LCRecordingManager:removeSessionForBundleID");
    std::erase_if(bundleIDToRecordingSessionLookup_, [&](const auto& entry) { return entry.first == bundleID; });
}

void LCRecordingManager::onRequestLane(Task task) {
    SerialQueue& lane = platform_.scheduler.mainQueue();
    if (lane.isCurrent())
        task();
    else
        lane.async(std::move(task));
}

}  // namespace lumacast
