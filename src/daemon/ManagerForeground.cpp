// Whose recording it is that the user has in front, and what changes of the display do to recordings.

#include <algorithm>

#include "daemon/LCRecordingManager.h"

namespace lumacast {

namespace {

constexpr ProcessID kNoProcess{-1};
/// Elements from this level on lie above what applications show.
constexpr std::int64_t kFirstLevelAbove = 2;

}  // namespace

bool LCRecordingManager::isApplicationInForegroundWithBundleIdentifier(const BundleIdentifier& bundleID) {
    return (platform_.appStateMonitor.applicationState(bundleID) & AppStateMonitor::kRunningForeground) != 0;
}

void LCRecordingManager::frontmostSession(const LCRecordingSession& session,
                                          const std::function<void(ProcessID)>& handler) {
    if (session.isSystemRecording()) {
        const auto front = platform_.appStateMonitor.frontmostApplication();
        const auto process = front ? platform_.appStateMonitor.applicationProcess(*front) : std::nullopt;
        handler(process.value_or(kNoProcess));
        return;
    }
    const auto proxy = session.clientProxy();
    const auto connection = proxy ? proxy->connection() : nullptr;
    handler(connection ? connection->processIdentifier() : kNoProcess);
}

void LCRecordingManager::monitorForegroundApps(const std::shared_ptr<LCRecordingSession>& session) {
    monitoredSession_ = session;
    if (!session->isSystemRecording()) {
        platform_.appStateMonitor.setHandler({});
        return;
    }
    platform_.appStateMonitor.setHandler([weak = std::weak_ptr(session)](std::int64_t state, bool frontmost,
                                                                        ProcessID pid) {
        const auto recorded = weak.lock();
        if (!recorded) return;
        if (state == AppStateMonitor::kEnded) recorded->checkAndStopAppAudioForPID(pid);
        if (frontmost)
            recorded->updateProcessIDForAudioCaptureWithPID(pid);
        else if (pid == recorded->frontmostPIDForAudioTap())
            recorded->updateProcessIDForAudioCaptureWithPID(kNoProcess);
    });
}

void LCRecordingManager::notifySystemRecordingMayBeStopped() {
    for (const auto& [id, session] : bundleIDToRecordingSessionLookup_)
        if (session->isSystemRecording() && session->isRecording()) session->notifyRecordingMayBeStopped();
}

void LCRecordingManager::notifySystemRecordingResumed() {
    for (const auto& [id, session] : bundleIDToRecordingSessionLookup_)
        if (session->isSystemRecording() && session->isRecording()) session->notifyRecordingResumed();
}

void LCRecordingManager::setLayoutMonitor(std::shared_ptr<DisplayLayoutMonitor> monitor) {
    layoutMonitor_ = std::move(monitor);
    if (layoutMonitor_) layoutMonitor_->addObserver(weak_from_this());
}

void LCRecordingManager::layoutMonitorDidUpdateDisplayLayout(DisplayLayoutMonitor*,
                                                             const std::vector<DisplayLayoutElement>& layout) {
    const auto isLow = [](const DisplayLayoutElement& element) { return element.level < kFirstLevelAbove; };
    // Deliberately a return to one element counts as a resize just as a change to several low ones does, and none at all
    // too; but one element after another does not.
    bool resized = layout.size() == 1 && previousElementCount_ > 1;
    std::int32_t count = 0;
    if (layout.size() != 1) {
        count = static_cast<std::int32_t>(std::count_if(layout.begin(), layout.end(), isLow));
        resized = std::all_of(layout.begin(), layout.end(), isLow);
    }
    previousElementCount_ = count;
    if (!resized) return;
    const auto sessions = bundleIDToRecordingSessionLookup_;
    for (const auto& [id, session] : sessions) {
        if (!session->isRecording() || session->isSystemRecording()) continue;
        const std::uint64_t generation = session->managerRecord.startGeneration;
        const auto underWay = noteStopUnderWay(session, generation);
        session->finishSessionWithHandler([self = shared_from_this(), session = session, generation, underWay](
                                              const std::optional<URL>& url, const std::optional<Error>&) {
            self->onRequestLane([self, session, generation, url] {
                self->recordingSessionStoppedWithError(
                    session, self->services_.errors._lcUserErrorForCode(RecordingErrorCode::ContentResize), url);
                self->resetAfterStop(session, generation);
            });
        });
    }
}

}  // namespace lumacast
