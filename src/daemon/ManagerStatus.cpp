// What the administrator sees of the manager.

#include "daemon/LCRecordingManager.h"

namespace lumacast {

namespace {

Dictionary describeRecording(const LCRecordingSession& session) {
    Dictionary recording{{"paused", session.isPaused()}, {"elapsedSeconds", session.activeDuration()}};
    if (const auto writer = session.movieWriter()) {
        recording.set("path", writer->outputPath());
        recording.set("width", writer->windowSize().width);
        recording.set("height", writer->windowSize().height);
        if (const auto file = writer->assetWriter()) {
            recording.set("bytes", file->bytesWritten());
            recording.set("framesRecorded", file->picturesTaken());
        }
    }
    if (const auto agent = session.reportingAgent()) recording.set("frames", agent->metrics().videoFrameCount);
    if (const auto source = session.screenCaptureController()) {
        // The source is older than the recording.
        const auto counters = source->counters(), before = session.managerRecord.countersBefore;
        recording.set("framesDelivered", counters.delivered - before.delivered);
        recording.set("framesDropped", counters.dropped - before.dropped);
    }
    if (const auto extension = session.broadcastExtensionID()) {
        recording.set("broadcastExtension", extension->text());
        if (const auto proxy = session.broadcastUploadExtensionProxy())
            recording.set("framesLeftOut", proxy->framesLeftOut());
    }
    return recording;
}

}  // namespace

Dictionary LCRecordingManager::snapshot() const {
    Array sessions;
    for (const auto& [id, session] : bundleIDToRecordingSessionLookup_) {
        const auto proxy = session->clientProxy();
        const auto connection = proxy ? proxy->connection() : nullptr;
        Dictionary entry{{"bundleID", id.text()},
                         {"connected", connection != nullptr},
                         {"recording", session->isRecording()},
                         {"wholeDisplay", session->isSystemRecording()},
                         {"transactionOpen", !session->managerRecord.openTransactions.empty()}};
        if (connection) entry.set("pid", number(connection->processIdentifier()));
        if (session->isRecording()) entry.set("current", describeRecording(*session));
        sessions.emplace_back(std::move(entry));
    }
    return {{"service", "com.orvane.lumacastd"},
            {"temporaryDirectory", services_.tempStore._srTempPath()},
            {"freeBytes", services_.tempStore._srDeviceFreeDiskSpace()},
            {"startsWaitingForUser", static_cast<std::uint64_t>(waitingStarts_.size())},
            {"sessions", std::move(sessions)},
            {"saves", describeSaves()}};
}

}  // namespace lumacast
