// What recordings of the whole display need beyond others: their sounds, and their movies in the library.

#include "daemon/LCRecordingManager.h"

namespace lumacast {

LCRecordingManager::PathClaim LCRecordingManager::claimOf(const LCRecordingSession& session) const {
    const auto writer = session.movieWriter();
    return {session.pathClaim(), writer ? services_.tempStore.rememberClaims(writer->outputPath()) : nullptr};
}

void LCRecordingManager::checkAndPlaySystemRecordSound(const LCRecordingSession& session, bool isRecordingOn) {
    const bool rule = platform_.deviceInfo.regionalRule("RegionalBehaviorShutterClick").value_or(false);
    if (!rule && !platform_.screenReader.isRunning()) return;
    if (!session.isSystemRecording()) return;
    platform_.systemSounds.play(isRecordingOn ? SystemSounds::kBeginRecording : SystemSounds::kEndRecording);
}

void LCRecordingManager::clearSystemRecordingUI(const LCRecordingSession& session) {
    if (!session.isSystemRecording()) return;
    log_.line("stop monitoring foreground apps");
    // Another system recording may have begun meanwhile: its handler stays.
    const auto monitored = monitoredSession_.lock();
    if (!monitored || monitored.get() == &session) platform_.appStateMonitor.setHandler({});
}

void LCRecordingManager::addSystemRecordingToLibrary(const LCRecordingSession& session,
                                                     const std::optional<URL>& movieURL, const PathClaim& claim,
                                                     std::function<void(std::optional<Error>)> added) {
    const UserID user = session.managerRecord.user.value_or(platform_.fileSystem.user());
    platform_.scheduler.globalQueue(QueuePriority::Default)
        .async([self = shared_from_this(), movieURL, claim, user, added = std::move(added)]() mutable {
            std::optional<Error> error;
            // Two that begin in the same second have one name: what stands there then is the newer one's.
            if (movieURL && !self->services_.tempStore.isClaimedAfter(movieURL->path(), claim.number)) {
                auto result = self->platform_.photoLibrary.addVideo(*movieURL, user);
                if (auto* const failure = std::get_if<Error>(&result)) error = std::move(*failure);
            } else {
                error = self->services_.errors._lcUserErrorForCode(RecordingErrorCode::FailedToSave);
            }
            self->onRequestLane([added = std::move(added), error = std::move(error)] { added(error); });
        });
}

void LCRecordingManager::keepPreemptedSystemRecording(const std::shared_ptr<LCRecordingSession>& session,
                                                      const EndedRecording& ended,
                                                      const std::optional<URL>& movieURL) {
    // A newer recording of the same application has a handler of its own by then.
    if (session->managerRecord.startGeneration == ended.generation) clearSystemRecordingUI(*session);
    addSystemRecordingToLibrary(
        *session, movieURL, ended.claim,
        [self = shared_from_this(), session, ended, movieURL](const std::optional<Error>& error) {
            if (error)
                self->log_.line("LCRecordingManager:stopCurrentRecordingSession: Video saved to camera roll failed");
            else
                self->log_.line(
                    "LCRecordingManager:stopCurrentRecordingSession: Video saved to camera roll successful");
            // The name that the session removes is that of the moment; the movie's own goes only once the library has it.
            if (movieURL && !error) self->services_.tempStore.removeFileOfClaim(*movieURL, ended.claim.number, {});
            self->discardInterruptedRecording(session, ended, std::nullopt);
        });
}

void LCRecordingManager::stopSystemRecordingWithHandler(SystemStopHandler handler) {
    const auto sessions = bundleIDToRecordingSessionLookup_;
    for (const auto& [id, session] : sessions) {
        if (!session->isSystemRecording() || !session->isRecording()) continue;
        stopRecordingSession(
            session, 0, 0,
            [self = shared_from_this(), session = session, claim = claimOf(*session), handler](
                const std::optional<URL>& url, const std::optional<Error>& error) {
                if (!handler) return;
                if (!url) return handler(session, url, error);
                self->addSystemRecordingToLibrary(
                    *session, url, claim, [self, session, handler, url, error](const std::optional<Error>& failure) {
                        if (failure) self->log_.line("error saving file with code: %i", failure->code());
                        handler(session, url, error);
                    });
            });
    }
}

void LCRecordingManager::stopSystemRecordingWithInterruption() {
    stopSystemRecordingWithHandler([self = shared_from_this()](const std::shared_ptr<LCRecordingSession>& session,
                                                               const std::optional<URL>&, const std::optional<Error>&) {
        self->recordingSessionStoppedWithError(
            session, self->services_.errors._lcUserErrorForCode(RecordingErrorCode::Interrupted));
    });
}

}  // namespace lumacast
