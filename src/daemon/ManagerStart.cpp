// Starting a recording: from the request's first check to the client's reply.

#include <algorithm>
#include <cmath>
#include <utility>

#include "daemon/LCRecordingManager.h"
#include "platform/PreferenceKeys.h"

namespace lumacast {

namespace {

constexpr std::string_view kSystemRecordingEntitlement = "com.orvane.private.luma-cast";

/// A session's capture source keeps its first size for good, so one that no picture can have must not get there.
bool isSize(Size size) {
    return std::isfinite(size.width) && std::isfinite(size.height) && size.width >= 1 && size.height >= 1;
}

/// Whose connection the session has now.
std::optional<ProcessID> clientOf(const LCRecordingSession& session) {
    const auto proxy = session.clientProxy();
    const auto connection = proxy ? proxy->connection() : nullptr;
    return connection ? std::optional(connection->processIdentifier()) : std::nullopt;
}

}  // namespace

bool LCRecordingManager::checkContextIDsMatch(const std::vector<ContextID>& contextIDs) {
    return checkContextIDsMatch(contextIDs, getCallingConnectionBundleID());
}

bool LCRecordingManager::checkContextIDsMatch(const std::vector<ContextID>& contextIDs,
                                              const std::optional<BundleIdentifier>& caller) {
    for (const ContextID contextID : contextIDs) {
        auto port = platform_.renderServer.clientPort(contextID);
        if (!port) return false;
        const auto pid = port->processIdentifier();
        port.reset();
        if (!pid) return false;
        const auto owner = bundleIDOfProcess(*pid);
        if (!owner || owner != caller) return false;  // an absent identifier matches nobody
    }
    return true;  // an empty list deliberately passes
}

void LCRecordingManager::logRefusal(std::uint64_t number, RecordingErrorCode code, std::string_view reason) {
    log_.line("start request %lu refused with %d: %@", number, code, reason);
}

void LCRecordingManager::refuse(const WaitingStart& start, RecordingErrorCode code, std::string_view reason) {
    logRefusal(start.number, code, reason);
    start.handler(services_.errors._lcUserErrorForCode(code), false, false);
}

void LCRecordingManager::startRecording(const StartRequest& request, StartHandler handler) {
    const auto start = std::make_shared<WaitingStart>();
    start->session = getCallingConnectionRecordingSession();
    start->connection = callingConnection_;
    start->request = request;
    start->number = ++requestNumber_;
    start->handler = std::move(handler);
    const auto& session = start->session;
    if (const auto reason = whyNotAllowed(*start, getCallingConnectionBundleID()))
        return refuse(*start, reason->first, reason->second);
    if (!isSize(request.windowSize) || (session && !session->canCaptureSize(request.windowSize)))
        return refuse(*start, RecordingErrorCode::FailedToStart, "the window size is none");
    log_.line(
        "LCRecordingManager:startRecordingWindowLayerContextID:windowSize:microphoneEnabled:streaming:withHandler:");
    stopCurrentRecordingSessionWithHandler(*start, [this, start] { startProper(start); });
}

std::optional<LCRecordingManager::Refusal> LCRecordingManager::whyNotAllowed(
    const WaitingStart& start, const std::optional<BundleIdentifier>& caller) {
    if (!start.request.systemRecording) {
        if (checkContextIDsMatch(start.request.windowLayerContextIDs, caller)) return std::nullopt;
        return Refusal{RecordingErrorCode::FailedToStart, "a window layer is not the application's own"};
    }
    const auto proxy = start.session ? start.session->clientProxy() : nullptr;
    const auto connection = proxy ? proxy->connection() : nullptr;
    const auto granted = connection ? connection->valueForEntitlement(kSystemRecordingEntitlement) : std::nullopt;
    const bool* entitled = granted ? granted->as<bool>() : nullptr;
    if (entitled && *entitled) return std::nullopt;
    return Refusal{RecordingErrorCode::Entitlements, "the application lacks the entitlement"};
}

void LCRecordingManager::startProper(const WaitingStartRef& start) {
    if (!services_.tempStore._srDeviceHasSufficientFreeSpaceForRecording()) {
        log_.line("insufficient disk space for recording, calling handler with error");
        return refuse(*start, RecordingErrorCode::InsufficientStorage, "100 MB must be free");
    }
    // A session that has gone is nobody's, and nobody is in the foreground.
    if (!start->session || !isApplicationInForegroundWithBundleIdentifier(start->session->bundleID())) {
        log_.line("app is not in the foreground, calling handler with error");
        return refuse(*start, RecordingErrorCode::FailedToStart, "the application is not in the foreground");
    }
    microphoneRecording_ = start->request.microphoneEnabled;
    cameraRecording_ = start->request.cameraEnabled;
    const bool suppressAlert = isTrue(platform_.preferences.value(kPreferenceDomain, kSuppressAlertKey));
    log_.line("LCRecordingManager: suppressAlert=%d", suppressAlert);
    if (suppressAlert)
        beginRecording(start);
    else
        showAcknowledgementAlertForSession(start);
}

void LCRecordingManager::beginRecording(const WaitingStartRef& start) {
    const auto& session = start->session;
    const StartRequest& request = start->request;
    log_.line("starting...");
    resetUnansweredStops(session);
    const std::uint64_t generation = ++session->managerRecord.startGeneration;
    session->managerRecord.openTransactions.push_back(generation);
    beginTransaction();
    // An older start of this application that still waits for its extension is over.
    session->managerRecord.broadcastGeneration = generation;
    session->endWaitForExtension();
    const auto reachesNobody = [](const auto& older) { return older.reachesNobody; };
    const auto& older = session->managerRecord.pendingStarts;
    if (std::any_of(older.begin(), older.end(), reachesNobody))
        answerPendingStarts(*session, services_.errors._lcUserErrorForCode(RecordingErrorCode::FailedToStart), reachesNobody);
    if (!request.broadcast) {
        log_.line("broadcast disabled");
        session->disableBroadcast();
        return startEnabledRecording(start, generation);
    }
    log_.line("broadcast requested");
    const auto found = hostBundleIDtoExtensionInfoLookup_.find(session->bundleID());
    if (found != hostBundleIDtoExtensionInfoLookup_.end()) {
        log_.line("found broadcast info, enabling for session");
        return enableBroadcast(start, generation, found->second);
    }
    log_.line("attempted to start broadcast without a session, bailing out");
    resetStatesForSession(session, generation);
    logRefusal(start->number, RecordingErrorCode::InvalidBroadcastSession, "no broadcast has been set up");
    // Deliberately without user info, so without description.
    start->handler(
        Error(std::string(kRecordingErrorDomain), static_cast<std::int64_t>(RecordingErrorCode::InvalidBroadcastSession)),
        false, false);
}

void LCRecordingManager::startEnabledRecording(const WaitingStartRef& start, std::uint64_t generation,
                                               const std::shared_ptr<LCBroadcastExtensionProxy>& link) {
    const auto& session = start->session;
    const StartRequest& request = start->request;
    session->managerRecord.startConnection = start->connection;
    session->managerRecord.user = start->connection->userIdentifier();
    const auto source = session->screenCaptureController();
    session->managerRecord.countersBefore = source ? source->counters() : DisplayCaptureSource::Counters{};
    session->setRecording(true);
    session->setIsBroadcasting(request.broadcast);
    interruptOtherRecordingSessionAgainstSession(session);
    session->setSystemRecording(request.systemRecording);
    session->setContextIDs(request.windowLayerContextIDs);
    session->setWindowSize(request.windowSize);
    session->setMicrophoneEnabled(microphoneRecording_);
    session->setDelegate(weak_from_this());
    session->setCaptureRecording(request.captureEnabled);
    frontmostSession(*session, [&](ProcessID pid) { session->setFrontmostPIDForAudioTap(pid); });
    const auto answer = std::make_shared<StartHandler>(start->handler);
    // An extension that fails before it has taken note of the start answers it.
    if (request.broadcast) {
        auto& pending = session->managerRecord.pendingStarts;
        std::erase_if(pending, [](const auto& older) { return !*older.answer; });
        pending.push_back({generation, link, answer, link && !link->connection()});
    }
    session->startSessionWithHandler([self = shared_from_this(), session, answer] {
        self->checkAndPlaySystemRecordSound(*session, true);
        self->log_.line("recording session started");
        if (const auto handler = std::exchange(*answer, {}))
            handler(std::nullopt, self->microphoneRecording_, self->cameraRecording_);
    });
    monitorForegroundApps(session);
}

void LCRecordingManager::stopCurrentRecordingSessionWithHandler(const WaitingStart& by, Handler handler) {
    log_.line("LCRecordingManager:stopCurrentRecordingSession:");
    const auto sessions = bundleIDToRecordingSessionLookup_;
    for (const auto& [id, session] : sessions) {
        if (!session->isRecording()) continue;
        const auto end = session->isSystemRecording() ? &LCRecordingManager::keepPreemptedSystemRecording
                                                      : &LCRecordingManager::discardInterruptedRecording;
        // Whoever starts in the place of a client that has gone has not lost anything.
        const bool isTold = session != by.session || session->managerRecord.startConnection.lock() == by.connection;
        stopRecordingSession(
            session, 0, 0,
            [self = shared_from_this(), end, session,
             ended = EndedRecording{session->managerRecord.startGeneration, claimOf(*session), isTold,
                                    clientOf(*session)}](
                const std::optional<URL>& url, const std::optional<Error>&) { ((*self).*end)(session, ended, url); });
    }
    // Deliberately without waiting for the stops to complete.
    if (handler) handler();
}

void LCRecordingManager::discardInterruptedRecording(const std::shared_ptr<LCRecordingSession>& session,
                                                     const EndedRecording& ended, const std::optional<URL>& movieURL) {
    auto tellClient = [self = shared_from_this(), session, isTold = ended.isTold, client = ended.client] {
        if (!isTold) return;
        self->onRequestLane([self, session, client] {
            // Another process of the application may have connected since: it has not lost anything.
            const auto now = clientOf(*session);
            if (now && now != client) return;
            if (const auto proxy = session->clientProxy())
                proxy->stopRecordingWithError(
                    self->services_.errors._lcUserErrorForCode(RecordingErrorCode::Interrupted), std::nullopt);
        });
    };
    if (session->managerRecord.startGeneration == ended.generation) {
        session->finishAndCleanupSessionFilesWithHandler(std::move(tellClient));
        return;
    }
    // The application has started anew meanwhile: only this stop's own movie goes, and not where a later writer has
    // its path.
    if (movieURL) services_.tempStore.removeFileOfClaim(*movieURL, ended.claim.number, {});
    tellClient();
}

void LCRecordingManager::interruptOtherRecordingSessionAgainstSession(
    const std::shared_ptr<LCRecordingSession>& session) {
    log_.line("LCRecordingManager:interruptRecordingSessions");
    const auto sessions = bundleIDToRecordingSessionLookup_;
    for (const auto& [id, other] : sessions) {
        if (id == session->bundleID()) continue;
        // Idle sessions are asked too: they stay silent. Deliberately one way for all: room was made before the user was
        // asked, so a recording of the whole display that began meanwhile ends without sound and library as well.
        other->finishSessionWithHandler(
            [self = shared_from_this(), other = other, generation = other->managerRecord.startGeneration](
                const std::optional<URL>& url, const std::optional<Error>& error) {
                self->onRequestLane([self, other, generation, url, error] {
                    self->log_.line("interrupted session");
                    self->recordingSessionInterrupted(other, error, url);
                    other->setInterruptedMovieURL(url);
                    self->resetStatesForSession(other, generation);
                });
            });
    }
}

}  // namespace lumacast
