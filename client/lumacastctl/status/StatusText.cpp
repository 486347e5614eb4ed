#include <algorithm>
#include <cmath>

#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/status/Status.h"

namespace lumacast::ctl {

namespace {

std::string row(std::string_view name, const std::string& text) {
    constexpr std::size_t kColumn = 9;
    std::string line = "  " + std::string(name);
    line.resize(2 + kColumn, ' ');
    return line + text + "\n";
}

std::string pidText(const ApplicationSession& session) {
    return session.pid ? "pid " + std::to_string(*session.pid) : "no process";
}

std::string stateText(const ApplicationSession& session) {
    if (!session.recording) return session.connected ? "idle" : "not connected";
    return session.recording->paused ? "paused" : "recording";
}

std::string framesText(const RunningRecording& recording) {
    const auto& frames = recording.recorded ? recording.recorded : recording.frames;
    std::string text = frames ? std::to_string(*frames) : "unknown";
    if (recording.delivered && recording.dropped)
        text += " (" + std::to_string(*recording.delivered) + " captured, " + std::to_string(*recording.dropped) +
                " dropped)";
    return text;
}

std::string recordingText(const ApplicationSession& session, const RunningRecording& recording) {
    std::string text = printable(session.application) + " (" + pidText(session) + "): " + stateText(session) + "\n";
    text += row("elapsed", durationText(recording.elapsedSeconds));
    if (recording.width && recording.height)
        text += row("picture", std::to_string(std::llround(*recording.width)) + " x " +
                                   std::to_string(std::llround(*recording.height)) + " pixels");
    text += row("frames", framesText(recording));
    if (recording.extension) {
        text += row("to", printable(*recording.extension));
        if (recording.leftOut.value_or(0) > 0)
            text += row("", std::to_string(*recording.leftOut) + " frames left out: it was too slow for them");
    }
    if (recording.bytes) text += row("size", bytesText(*recording.bytes));
    if (recording.path) text += row("file", printable(*recording.path));
    return text;
}

std::string sessionLines(const std::vector<ApplicationSession>& sessions) {
    std::size_t widestName = 0, widestPid = 0;
    for (const ApplicationSession& session : sessions) {
        widestName = std::max(widestName, printable(session.application).size());
        widestPid = std::max(widestPid, pidText(session).size());
    }
    std::string text;
    for (const ApplicationSession& session : sessions) {
        std::string name = printable(session.application), pid = pidText(session);
        name.resize(widestName, ' ');
        pid.resize(widestPid, ' ');
        text += "  " + name + "  " + pid + "  " + stateText(session) + "\n";
    }
    return text;
}

}  // namespace

std::string statusText(const DaemonStatus& status) {
    std::string text;
    for (const ApplicationSession& session : status.sessions)
        if (session.recording) text += recordingText(session, *session.recording) + "\n";
    if (text.empty()) text = "Nothing is being recorded.\n\n";
    if (status.sessions.empty())
        text += "No application is connected.\n";
    else
        text += "Applications\n" + sessionLines(status.sessions);
    text += "\nFree space: ";
    // The daemon says 0 for a place it can't ask, and before the directory is made.
    text += status.freeBytes == 0 ? std::string("unknown, or none") : bytesText(status.freeBytes);
    if (!status.temporaryDirectory.empty()) text += " in " + printable(status.temporaryDirectory);
    return text + "\n";
}

}  // namespace lumacast::ctl
