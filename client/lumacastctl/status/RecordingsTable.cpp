#include <algorithm>
#include <array>

#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/status/Status.h"

namespace lumacast::ctl {

namespace {

constexpr std::size_t kColumns = 6;
/// From this one on they are numbers, and stand to the right.
constexpr std::size_t kFirstNumber = 2;
using Line = std::array<std::string, kColumns>;

std::string countText(const std::optional<std::uint64_t>& count) { return count ? std::to_string(*count) : "-"; }

Line lineOf(const ApplicationSession& session, const RunningRecording& recording) {
    return {printable(session.application),
            recording.paused ? "paused" : "recording",
            durationText(recording.elapsedSeconds),
            recording.bytes ? bytesText(*recording.bytes) : "-",
            countText(recording.recorded ? recording.recorded : recording.frames),
            countText(recording.dropped)};
}

}  // namespace

std::string recordingsTable(const DaemonStatus& status) {
    std::vector<Line> lines{{"APPLICATION", "STATE", "ELAPSED", "SIZE", "RECORDED", "DROPPED"}};
    for (const ApplicationSession& session : status.sessions)
        if (session.recording) lines.push_back(lineOf(session, *session.recording));
    if (lines.size() == 1) return "Nothing is being recorded.\n";
    std::array<std::size_t, kColumns> widths{};
    for (const Line& line : lines)
        for (std::size_t i = 0; i < kColumns; ++i) widths[i] = std::max(widths[i], line[i].size());
    std::string text;
    for (const Line& line : lines) {
        for (std::size_t i = 0; i < kColumns; ++i) {
            const std::string filling(widths[i] - line[i].size(), ' ');
            if (i > 0) text += "  ";
            text += i < kFirstNumber ? line[i] + filling : filling + line[i];
        }
        text += "\n";
    }
    return text;
}

}  // namespace lumacast::ctl
