// Stopping, discarding, and the reports of sessions that stopped.

#include "daemon/LCRecordingManager.h"

namespace lumacast {

void LCRecordingManager::stopRecordingWithHandler(StopHandler handler) {
    log_.line("LCRecordingManager: stopRecordingWithHandler:");
    stopRecordingWithStartClipDuration(0, 0, std::move(handler));
}

void LCRecordingManager::stopRecordingWithStartClipDuration(double startClipDuration, double endClipDuration,
                                                            StopHandler handler) {
    // Deliberately an older name of the message.
    log_.line("LCRecordingManager: stopRecordingWithStartTimeOffset:endTimeOffset:handler:");
    if (const auto session = getCallingConnectionRecordingSession())
        stopRecordingSession(session, startClipDuration, endClipDuration, std::move(handler));
}

void LCRecordingManager::stopRecordingSession(const std::shared_ptr<LCRecordingSession>& session,
                                              double startClipDuration, double endClipDuration, StopHandler handler) {
    log_.line("LCRecordingManager: stopRecordingSession:handler:");
    if (!session->isRecording()) return;
    const std::uint64_t generation = session->managerRecord.startGeneration;
    if (!handler) {
        // A recording that nobody waits for is deliberately thrown away.
        log_.line("recording stopped without handler!");
        session->finishAndCleanupSessionFilesWithHandler([self = shared_from_this(), session, generation] {
            self->onRequestLane([self, session, generation] { self->resetAfterStop(session, generation); });
        });
        return;
    }
    session->finishSessionWithStartClipDuration(
        startClipDuration, endClipDuration,
        [self = shared_from_this(), session, generation, handler = std::move(handler)](std::optional<URL> url,
                                                                                       std::optional<Error> error) {
            self->onRequestLane([self, session, generation, handler, url, error] {
                handler(url, error);
                self->resetAfterStop(session, generation);
            });
        });
}

void LCRecordingManager::resetAfterStop(const std::shared_ptr<LCRecordingSession>& session, std::uint64_t generation) {
    // A newer start has ended this recording's transaction itself and is left alone; so is a session that was reset
    // already.
    if (session->managerRecord.transactionOf == generation) resetStatesForSession(session);
}

void LCRecordingManager::resetStatesForSession(const std::shared_ptr<LCRecordingSession>& session) {
    log_.line("LCRecordingManager:resetStatesForSession:");
    session->setRecording(false);
    session->setPaused(false);
    if (session->managerRecord.transactionOf) {
        session->managerRecord.transactionOf.reset();
        endTransaction();
    }
}

void LCRecordingManager::discardRecordingWithHandler(Handler handler) {
    log_.line("LCRecordingManager: discardRecording");
    const auto session = getCallingConnectionRecordingSession();
    if (!session) return;
    if (session->isRecording()) {
        // Deliberately never answered.
        log_.line("can't discard recording while recording is in progress");
        return;
    }
    session->finishAndCleanupSessionFilesWithHandler(std::move(handler));
}

void LCRecordingManager::recordingSessionStoppedWithError(const std::shared_ptr<LCRecordingSession>& session,
                                                          const std::optional<Error>& error) {
    // The report of an older start that arrives after a newer one is dropped.
    onRequestLane([self = shared_from_this(), session, error, start = session->startCount()] {
        if (session->startCount() != start) return;
        self->recordingSessionStoppedWithError(session, error, std::nullopt);
        // A session that stopped by itself is finished by nobody else.
        if (session->managerRecord.transactionOf) self->resetStatesForSession(session);
    });
}

void LCRecordingManager::recordingSessionStoppedWithError(const std::shared_ptr<LCRecordingSession>& session,
                                                          const std::optional<Error>& error,
                                                          const std::optional<URL>& movieURL) {
    log_.line("LCRecordingManager:recordingSessionStoppedWithError:movieURL:");
    if (const auto proxy = session->clientProxy()) proxy->stopRecordingWithError(error, movieURL);
}

void LCRecordingManager::recordingSessionInterrupted(const std::shared_ptr<LCRecordingSession>& session,
                                                     const std::optional<Error>& error,
                                                     const std::optional<URL>& movieURL) {
    if (const auto proxy = session->clientProxy()) proxy->stopRecordingWithError(error, movieURL);
}

void LCRecordingManager::broadcastSessionDidUpdateServiceInfo(const std::shared_ptr<LCRecordingSession>& session,
                                                              const Dictionary& info) {
    log_.line("LCRecordingManager:broadcastSessionDidUpdateServiceInfo:");
    if (const auto proxy = session->clientProxy()) proxy->updateBroadcastServiceInfo(info);
}

}  // namespace lumacast
