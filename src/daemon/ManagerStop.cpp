// Stopping, discarding, and the reports of sessions that stopped.

#include <algorithm>
#include <utility>

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
    checkAndPlaySystemRecordSound(*session, false);
    log_.line("LCRecordingManager: stopRecordingSession:handler:");
    clearSystemRecordingUI(*session);
    clearCurrentBroadcastImages();
    if (!session->isRecording()) return;
    if (layoutMonitor_) layoutMonitor_->removeObserver(*this);
    // The set-up ends with the recording, though the stop is answered later: what is started meanwhile needs its own, or it
    // would share a process that is about to end.
    hostBundleIDtoExtensionInfoLookup_.erase(session->bundleID());
    const std::uint64_t generation = session->managerRecord.startGeneration;
    const auto underWay = noteStopUnderWay(session, generation);
    if (!handler && !session->broadcastExtensionID()) {
        // A recording that nobody waits for is deliberately thrown away.
        log_.line("recording stopped without handler!");
        session->finishAndCleanupSessionFilesWithHandler([self = shared_from_this(), session, generation, underWay] {
            self->onRequestLane([self, session, generation] { self->resetAfterStop(session, generation); });
        });
        return;
    }
    session->finishSessionWithStartClipDuration(
        startClipDuration, endClipDuration,
        [self = shared_from_this(), session, generation, underWay, handler = std::move(handler)](
            const std::optional<URL>& url, const std::optional<Error>& error) {
            self->onRequestLane([self, session, generation, handler, url, error] {
                if (handler) handler(url, error);
                self->resetAfterStop(session, generation);
            });
        });
}

std::shared_ptr<void> LCRecordingManager::noteStopUnderWay(const std::shared_ptr<LCRecordingSession>& session,
                                                           std::uint64_t generation) {
    session->managerRecord.stopsUnderWay.push_back(generation);
    // Answered or dropped, the completion lets this go. Once the application has left, nobody else resets what was
    // dropped.
    return {nullptr, [self = shared_from_this(), session, generation](std::nullptr_t) {
                self->onRequestLane([self, session, generation] {
                    std::erase(session->managerRecord.stopsUnderWay, generation);
                    if (self->registeredSession(session->bundleID()) != session) self->resetUnansweredStops(session);
                });
            }};
}

void LCRecordingManager::resetUnansweredStops(const std::shared_ptr<LCRecordingSession>& session) {
    // Neither one whose stop may still be answered, nor one that waits for its extension and ends by itself.
    const auto isUnderWay = [&record = session->managerRecord](std::uint64_t generation) {
        return std::count(record.stopsUnderWay.begin(), record.stopsUnderWay.end(), generation) > 0 ||
               std::count(record.startsWaiting.begin(), record.startsWaiting.end(), generation) > 0;
    };
    const auto open = session->managerRecord.openTransactions;
    for (const std::uint64_t generation : open)
        if (!isUnderWay(generation)) resetStatesForSession(session, generation);
}

void LCRecordingManager::resetAfterStop(const std::shared_ptr<LCRecordingSession>& session, std::uint64_t generation) {
    // A session that was reset already is left alone.
    if (session->managerRecord.hasTransactionOf(generation)) resetStatesForSession(session, generation);
}

void LCRecordingManager::resetStatesForSession(const std::shared_ptr<LCRecordingSession>& session,
                                               std::uint64_t generation) {
    log_.line("LCRecordingManager:resetStatesForSession:");
    // What a newer start uses is not an older one's to take away.
    if (session->managerRecord.startGeneration == generation) {
        session->setRecording(false);
        session->setPaused(false);
        // A set-up is used for one recording only.
        hostBundleIDtoExtensionInfoLookup_.erase(session->bundleID());
    }
    if (std::erase(session->managerRecord.openTransactions, generation) > 0) endTransaction();
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
        const std::uint64_t generation = session->managerRecord.startGeneration;
        if (error)
            answerPendingStarts(*session, *error, [&](const auto& pending) { return pending.generation == generation; });
        self->recordingSessionStoppedWithError(session, error, std::nullopt);
        // Deliberately it stays where it is: only a recording that another one takes the place of goes to the library.
        const auto proxy = session->clientProxy();
        const auto writer = session->movieWriter();
        if (session->isSystemRecording() && writer && !(proxy && proxy->connection()))
            self->log_.line("nobody hears of the end of a recording of the whole display: its movie is %@",
                            writer->outputPath());
        // A session that stopped by itself is finished by nobody else.
        self->resetAfterStop(session, session->managerRecord.startGeneration);
        // A tap may have been started while the session stopped.
        const auto& sessions = self->bundleIDToRecordingSessionLookup_;
        if (std::none_of(sessions.begin(), sessions.end(), [](const auto& s) { return s.second->isRecording(); }))
            self->services_.captureManager.stopAppAudioCapture();
    });
}

void LCRecordingManager::recordingSessionStoppedWithError(const std::shared_ptr<LCRecordingSession>& session,
                                                          const std::optional<Error>& error,
                                                          const std::optional<URL>& movieURL) {
    log_.line("LCRecordingManager:recordingSessionStoppedWithError:movieURL:");
    if (session->isSystemRecording()) {
        const auto show = [session, error] {
            if (session->broadcastExtension())
                showAlertForBroadcastSession(*session, error);
            else
                showAlertForRecordingSession(*session, error);
        };
        // While the user is asked the queue stands still, perhaps for ever, and the session would wait in it.
        if (isAsking_)
            show();
        else
            lumaAlertQueue().async(show);
    }
    clearSystemRecordingUI(*session);
    if (const auto proxy = session->clientProxy()) proxy->stopRecordingWithError(error, movieURL);
}

void LCRecordingManager::recordingSessionInterrupted(const std::shared_ptr<LCRecordingSession>& session,
                                                     const std::optional<Error>& error,
                                                     const std::optional<URL>& movieURL) {
    if (const auto proxy = session->clientProxy()) proxy->stopRecordingWithError(error, movieURL);
}

void LCRecordingManager::broadcastSessionDidUpdateServiceInfo(const std::shared_ptr<LCRecordingSession>& session,
                                                              const Value& info) {
    log_.line("LCRecordingManager:broadcastSessionDidUpdateServiceInfo:");
    if (const auto proxy = session->clientProxy()) proxy->updateBroadcastServiceInfo(info);
}

}  // namespace lumacast
