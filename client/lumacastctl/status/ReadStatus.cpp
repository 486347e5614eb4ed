#include "client/lumacastctl/Fields.h"
#include "client/lumacastctl/status/Status.h"
#include "linux/system/Json.h"

namespace lumacast::ctl {

namespace {

RunningRecording readRecording(const Dictionary& entry) {
    RunningRecording result;
    result.paused = flagIn(entry, "paused");
    result.elapsedSeconds = numberIn(entry, "elapsedSeconds").value_or(0);
    result.path = textIn(entry, "path");
    result.width = numberIn(entry, "width");
    result.height = numberIn(entry, "height");
    result.bytes = countIn(entry, "bytes");
    result.frames = countIn(entry, "frames");
    result.recorded = countIn(entry, "framesRecorded");
    result.delivered = countIn(entry, "framesDelivered");
    result.dropped = countIn(entry, "framesDropped");
    result.extension = textIn(entry, "broadcastExtension");
    result.leftOut = countIn(entry, "framesLeftOut");
    return result;
}

std::optional<ApplicationSession> readSession(const Value& value) {
    const auto* entry = value.as<Dictionary>();
    const auto application = entry ? textIn(*entry, "bundleID") : std::nullopt;
    if (!application) return std::nullopt;
    ApplicationSession result;
    result.application = *application;
    if (const auto pid = countIn(*entry, "pid")) result.pid = static_cast<std::int64_t>(*pid);
    result.connected = flagIn(*entry, "connected");
    result.wholeDisplay = flagIn(*entry, "wholeDisplay");
    const Value* current = entry->find("current");
    const auto* recording = current ? current->as<Dictionary>() : nullptr;
    if (recording) result.recording = readRecording(*recording);
    else if (flagIn(*entry, "recording")) result.recording = RunningRecording();
    return result;
}

}  // namespace

std::variant<DaemonStatus, std::string> readStatus(std::string_view answer) {
    const auto value = valueFromJson(answer);
    const auto* top = value ? value->as<Dictionary>() : nullptr;
    if (!top) return kNotUnderstood;
    if (const auto error = textIn(*top, "error")) return *error;
    const Value* sessions = top->find("sessions");
    const auto* list = sessions ? sessions->as<Array>() : nullptr;
    if (!list) return kNotUnderstood;
    DaemonStatus result;
    result.temporaryDirectory = textIn(*top, "temporaryDirectory").value_or("");
    result.freeBytes = countIn(*top, "freeBytes").value_or(0);
    for (const Value& entry : *list) {
        auto session = readSession(entry);
        if (!session) return kNotUnderstood;
        result.sessions.push_back(std::move(*session));
    }
    return result;
}

}  // namespace lumacast::ctl
