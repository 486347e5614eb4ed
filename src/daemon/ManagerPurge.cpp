// Giving storage back when the device runs short of it, and the administrator's look at the temporary movies.

#include <charconv>

#include "daemon/LCRecordingManager.h"
#include "daemon/StorageReport.h"

namespace lumacast {

namespace {

constexpr char kPurgeServiceName[] = "com.orvane.lumacastd-cache-delete";
/// From here on everything goes, a running recording first.
constexpr std::int32_t kUrgent = 3;

std::optional<std::int32_t> urgencyIn(const std::vector<std::string>& arguments) {
    if (arguments.size() != 1) return std::nullopt;
    const std::string& text = arguments[0];
    std::int32_t urgency = 0;
    const auto [end, failure] = std::from_chars(text.data(), text.data() + text.size(), urgency);
    if (failure != std::errc() || end != text.data() + text.size() || urgency < 1) return std::nullopt;
    return urgency;
}

}  // namespace

void LCRecordingManager::registerPurgeCallbacks() {
    const auto self = shared_from_this();  // held for as long as the service lives
    platform_.storagePurge.registerCallbacks(
        kPurgeServiceName, {.purgeableSpace = [self] { return self->cacheDeletePurgeableSpace(); },
                            .purge = [self](std::int32_t urgency) { return self->cacheDeletePurge(urgency); },
                            .cancelPurge = [](std::int32_t urgency) { return urgency; },
                            .periodic = [self] { return self->cacheDeletePeriodic(); }});
}

PurgeRecord LCRecordingManager::cacheDeletePurgeableSpace() {
    log_.line("LCRecordingManager: cache delete purgeable space callback");
    return {static_cast<std::uint64_t>(services_.tempStore._srSizeOfTempDir())};
}

std::optional<PurgeRecord> LCRecordingManager::cacheDeletePurge(std::int32_t urgency) {
    log_.line("LCRecordingManager: cache delete purge callback");
    SerialQueue& requestLane = platform_.scheduler.mainQueue();
    std::shared_ptr<LCRecordingSession> recording;  // the last one in the registry's order
    std::uint64_t lastClaim = 0;
    requestLane.sync([&] {
        // What is begun from now on is not this purge's: a recording that begins before the next look is not stopped there.
        lastClaim = services_.tempStore.lastClaim();
        for (const auto& [id, session] : bundleIDToRecordingSessionLookup_)
            if (session->isRecording()) recording = session;
    });
    if (urgency >= kUrgent) {
        requestLane.sync([&] {
            if (recording && recording->isRecording()) {
                stopRecordingSession(recording, 0, 0, {});
                recordingSessionStoppedWithError(
                    recording, services_.errors._lcUserErrorForCode(RecordingErrorCode::InsufficientStorage));
            }
        });
        // Deliberately without waiting for the stop.
        return PurgeRecord{services_.tempStore._srDeleteAllTempFiles(lastClaim)};
    }
    // Deliberately nothing in the usual case: only where the recording has ended between the two looks.
    if (!recording) return std::nullopt;
    bool isStillRecording = false;
    requestLane.sync([&] { isStillRecording = recording->isRecording(); });
    if (isStillRecording) return std::nullopt;
    return PurgeRecord{services_.tempStore._srDeleteFilesOlderThanTimeToLiveInSeconds(TempStore::kOneDay)};
}

PurgeRecord LCRecordingManager::cacheDeletePeriodic() {
    log_.line("LCRecordingManager: cache delete periodic callback");
    return {services_.tempStore._srDeleteFilesOlderThanTimeToLiveInSeconds(TempStore::kOneDay)};
}

std::vector<std::string> LCRecordingManager::pathsBeingRecorded() const {
    std::vector<std::string> paths;
    for (const auto& [id, session] : bundleIDToRecordingSessionLookup_)
        if (const auto writer = session->isRecording() ? session->movieWriter() : nullptr)
            paths.push_back(writer->outputPath());
    return paths;
}

void LCRecordingManager::serveStorageCommands() {
    platform_.admin.addCommand(
        "storage", [weak = weak_from_this()](const std::vector<std::string>&, const AdminAnswer& answer) {
            const auto self = weak.lock();
            if (!self) return;
            // Listing waits for the disk: on the purge service's lane.
            self->platform_.storagePurge.requestPurgeableSpace(
                [self, answer, recorded = self->pathsBeingRecorded()](std::optional<PurgeRecord> purgeable) {
                    answer(storageReport(self->platform_.fileSystem, self->services_.tempStore, purgeable, recorded));
                });
        });
    platform_.admin.addCommand(
        "purge", [weak = weak_from_this()](const std::vector<std::string>& arguments, const AdminAnswer& answer) {
            const auto self = weak.lock();
            if (!self) return;
            const auto urgency = urgencyIn(arguments);
            if (!urgency) return answer({{"error", "a purge takes one urgency, a whole number from 1 on"}});
            self->platform_.storagePurge.requestPurge(
                *urgency, [answer, urgency = *urgency](std::optional<PurgeRecord> record) {
                    answer({{"urgency", urgency}, {"freedBytes", record ? Value(record->bytes) : Value()}});
                });
        });
}

}  // namespace lumacast
