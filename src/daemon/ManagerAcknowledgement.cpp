// Asking the user before a recording. The alert queue shows the alert and waits; everything else is the request lane's.

#include <algorithm>
#include <utility>

#include "base/Limits.h"
#include "daemon/LCRecordingManager.h"

namespace lumacast {

void LCRecordingManager::showAcknowledgementAlertForSession(const WaitingStartRef& start) {
    log_.line("LCRecordingManager:showAcknowledgementAlert");
    if (isExemptFromAcknowledgementAlertSession(*start->session)) return beginRecording(start);
    const auto ofApplication = std::count_if(waitingStarts_.begin(), waitingStarts_.end(), [&](const auto& other) {
        return other->session->bundleID() == start->session->bundleID();
    });
    if (waitingStarts_.size() >= limitOf(Limit::StartsWaitingForUser) ||
        static_cast<std::uint64_t>(ofApplication) >= limitOf(Limit::StartsOfApplicationWaitingForUser))
        return refuse(*start, RecordingErrorCode::FailedToStart, "too many starts wait for the user's answer");
    start->alert = std::make_shared<AcknowledgementAlert>(platform_);
    waitingStarts_.push_back(start);
    askNext();
}

void LCRecordingManager::askNext() {
    while (!isAsking_ && !waitingStarts_.empty()) {
        const auto start = waitingStarts_.front();
        // While it waits, the flags are those of whoever has begun.
        const bool microphone = std::exchange(microphoneRecording_, start->request.microphoneEnabled);
        const bool camera = std::exchange(cameraRecording_, start->request.cameraEnabled);
        if (isExemptFromAcknowledgementAlertSession(*start->session)) {
            // While it waited, the user has acknowledged another start of the application.
            waitingStarts_.pop_front();
            const auto reason = whyNotAllowed(*start, start->session->bundleID());
            if (!reason) {
                continueAcknowledged(start);
                continue;
            }
            microphoneRecording_ = microphone;
            cameraRecording_ = camera;
            refuse(*start, reason->first, reason->second);
            continue;
        }
        microphoneRecording_ = microphone;
        cameraRecording_ = camera;
        isAsking_ = true;
        const AcknowledgementRequest request{start->session->bundleID(), start->session->isCapturing(),
                                             start->request.microphoneEnabled, start->request.cameraEnabled};
        lumaAlertQueue().async([self = shared_from_this(), start, request] {
            const auto response = start->alert->ask(acknowledgementAlertContent(self->services_.localization, request));
            self->onRequestLane([self, start, response] { self->takeAnswer(start, response); });
        });
    }
}

void LCRecordingManager::takeAnswer(const WaitingStartRef& start, std::optional<UserAlert::Response> response) {
    isAsking_ = false;
    std::erase(waitingStarts_, start);
    // An answer about a client that is not there any more has no effect.
    if (!isStillWanted(*start)) {
        refuse(*start, RecordingErrorCode::FailedToStart, "the client has gone while the user was asked");
    } else if (const auto reason = whyNotAllowed(*start, start->session->bundleID())) {
        refuse(*start, reason->first, reason->second);
    } else {
        // Other starts have set them meanwhile.
        const bool microphone = std::exchange(microphoneRecording_, start->request.microphoneEnabled);
        const bool camera = std::exchange(cameraRecording_, start->request.cameraEnabled);
        if (acknowledge(*start->session, response)) {
            continueAcknowledged(start);
        } else {
            microphoneRecording_ = microphone;
            cameraRecording_ = camera;
            log_.line("user declined");
            refuse(*start, RecordingErrorCode::UserDeclined,
                   response ? "the user does not want it" : "the user can't be asked");
        }
    }
    askNext();
}

bool LCRecordingManager::acknowledge(const LCRecordingSession& session, std::optional<UserAlert::Response> response) {
    if (!response) {
        log_.line("error showing acknowledgement alert");
        return false;
    }
    // Deliberately one test for all alerts: whatever its title says, only the other button refuses.
    if (*response == UserAlert::Response::OtherButton) {
        log_.line("user refused recording");
        return false;
    }
    // Deliberately an acknowledged recording goes on without camera and microphone, and is exempt only without them.
    if (cameraRecording_) {
        log_.line("user acknowledged recording, but camera recording is disabled");
        cameraRecording_ = false;
    } else {
        log_.line("user acknowledged recording, but microphone recording is disabled");
    }
    microphoneRecording_ = false;
    updateExemptionListWithSession(session);
    return true;
}

void LCRecordingManager::continueAcknowledged(const WaitingStartRef& start) {
    if (!start->session->isRecording()) return beginRecording(start);
    // Another start of the application has been faster.
    stopCurrentRecordingSessionWithHandler(*start, [this, start] { beginRecording(start); });
}

bool LCRecordingManager::isStillWanted(const WaitingStart& start) const {
    if (registeredSession(start.session->bundleID()) != start.session) return false;
    const auto proxy = start.session->clientProxy();
    return proxy && proxy->connection() == start.connection;
}

void LCRecordingManager::cancelOrphanedQuestions() {
    const auto waiting = waitingStarts_;
    for (const auto& start : waiting) {
        if (isStillWanted(*start)) continue;
        start->alert->cancel();
        // The one that is being asked about ends when its alert does.
        if (isAsking_ && start == waiting.front()) continue;
        std::erase(waitingStarts_, start);
        refuse(*start, RecordingErrorCode::FailedToStart, "the client has gone before the user was asked");
    }
}

}  // namespace lumacast
