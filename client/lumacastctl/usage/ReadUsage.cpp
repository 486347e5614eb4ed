#include "client/lumacastctl/Fields.h"
#include "client/lumacastctl/usage/Usage.h"
#include "linux/system/Json.h"
#include "linux/system/UsageEvents.h"

namespace lumacast::ctl {

namespace {

std::optional<std::int64_t> wholeIn(const Dictionary& dictionary, std::string_view key) {
    const Value* value = dictionary.find(key);
    const auto* whole = value ? value->as<std::int64_t>() : nullptr;
    return whole ? std::optional(*whole) : std::nullopt;
}

UsageEntry readEntry(const Dictionary& event, const Dictionary& payload) {
    UsageEntry entry;
    entry.ended = numberIn(event, "time");
    entry.service = textIn(event, "serviceName").value_or("");
    entry.activeSeconds = numberIn(payload, "ActiveDuration");
    entry.width = countIn(payload, "VideoCaptureWidth");
    entry.height = countIn(payload, "VideoCaptureHeight");
    entry.rate = countIn(payload, "VideoCaptureRate");
    entry.frames = countIn(payload, "VideoFrameCount");
    entry.soundBuffers = countIn(payload, "AppAudioFrameCount");
    entry.microphoneBuffers = countIn(payload, "MicFrameCount");
    entry.fileBytes = countIn(payload, "RecordedFileSize");
    entry.endReason = wholeIn(payload, "EndReason");
    entry.daemonEnded = wholeIn(event, "type") == kClosedAtEndEvent;
    return entry;
}

}  // namespace

std::variant<UsageReport, std::string> readUsage(std::string_view answer) {
    const auto value = valueFromJson(answer);
    const auto* top = value ? value->as<Dictionary>() : nullptr;
    if (!top) return kNotUnderstood;
    if (const auto error = textIn(*top, "error")) return *error;
    const Value* events = top->find("events");
    const auto* list = events ? events->as<Array>() : nullptr;
    if (!list) return kNotUnderstood;
    UsageReport report;
    report.damagedLines = countIn(*top, "damagedLines").value_or(0);
    report.unreadableFiles = countIn(*top, "unreadableFiles").value_or(0);
    report.lostEvents = countIn(*top, "lostEvents").value_or(0);
    for (const Value& each : *list) {
        const auto* event = each.as<Dictionary>();
        const auto type = event ? wholeIn(*event, "type") : std::nullopt;
        const Value* entry = event ? event->find("payload") : nullptr;
        const auto* payload = entry ? entry->as<Dictionary>() : nullptr;
        if (!type || !payload)
            ++report.damagedLines;
        else if (*type == kSummaryEvent || *type == kClosedAtEndEvent)
            report.entries.push_back(readEntry(*event, *payload));
    }
    return report;
}

}  // namespace lumacast::ctl
