// Which applications record without asking the user again, and for how long.

#include "daemon/LCRecordingManager.h"

namespace lumacast {

namespace {

constexpr double kExemptionThreshold = 480;  // seconds in the background; only more than these end an exemption

}  // namespace

const std::set<BundleIdentifier>& LCRecordingManager::exemptBundleIdentifiers() const {
    return microphoneRecording_ ? exemptWithMicRecordingEnabledBundleIdentifiers_ : exemptBundleIdentifiers_;
}

bool LCRecordingManager::isExemptFromAcknowledgementAlertSession(const LCRecordingSession& session) const {
    return exemptBundleIdentifiers().contains(session.bundleID());
}

void LCRecordingManager::updateExemptionListWithSession(const LCRecordingSession& session) {
    if (microphoneRecording_) exemptWithMicRecordingEnabledBundleIdentifiers_.insert(session.bundleID());
    exemptBundleIdentifiers_.insert(session.bundleID());
}

void LCRecordingManager::expireAcknowledgementExemptionsForBundleID(const std::optional<BundleIdentifier>& bundleID) {
    if (!bundleID) return;
    log_.line("LCRecordingManager:removeAcknowledgementExemptionIfOverThreshholdForBundleID:");
    const auto found = lastBackgroundDateByBundleIdentifier_.find(*bundleID);
    if (found == lastBackgroundDateByBundleIdentifier_.end()) return;
    if (secondsBetween(found->second, platform_.clock.now()) <= kExemptionThreshold) return;
    exemptBundleIdentifiers_.erase(*bundleID);
    exemptWithMicRecordingEnabledBundleIdentifiers_.erase(*bundleID);
    log_.line("removedExemption");
    lastBackgroundDateByBundleIdentifier_.erase(found);
}

void LCRecordingManager::clientDidBecomeActive() {
    log_.line("LCRecordingManager:clientDidBecomeActiveWithBundleID:");
    expireAcknowledgementExemptionsForBundleID(getCallingConnectionBundleID());
    const auto session = getCallingConnectionRecordingSession();
    if (!session || !session->isRecording()) return;
    // Deliberately only while it records again: an idle session keeps the movie's URL.
    const auto movieURL = session->interruptedMovieURL();
    if (!movieURL) return;
    log_.line("current session was interrupted - notify client app of error");
    recordingSessionStoppedWithError(session, services_.errors._lcUserErrorForCode(RecordingErrorCode::Interrupted),
                                     movieURL);
    session->setInterruptedMovieURL(std::nullopt);
}

void LCRecordingManager::clientDidResignActive() {
    log_.line("LCRecordingManager:clientDidResignActiveWithBundleID:");
    // The first moment in the background counts.
    if (const auto bundleID = getCallingConnectionBundleID())
        lastBackgroundDateByBundleIdentifier_.emplace(*bundleID, platform_.clock.now());
}

}  // namespace lumacast
