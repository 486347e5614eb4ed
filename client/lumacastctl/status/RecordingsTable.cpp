#include "client/lumacastctl/Table.h"
#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/status/Status.h"

namespace lumacast::ctl {

namespace {

std::string countText(const std::optional<std::uint64_t>& count) { return count ? std::to_string(*count) : "-"; }

std::vector<std::string> rowOf(const ApplicationSession& session, const RunningRecording& recording) {
    return {printable(session.application),
            recording.paused ? "paused" : "recording",
            durationText(recording.elapsedSeconds),
            recording.bytes ? bytesText(*recording.bytes) : "-",
            countText(recording.recorded ? recording.recorded : recording.frames),
            countText(recording.dropped)};
}

}  // namespace

std::string recordingsTable(const DaemonStatus& status) {
    constexpr auto kNumber = Column::Side::Right;
    std::vector<std::vector<std::string>> rows;
    for (const ApplicationSession& session : status.sessions)
        if (session.recording) rows.push_back(rowOf(session, *session.recording));
    if (rows.empty()) return "Nothing is being recorded.\n";
    return tableText({{"APPLICATION"},
                      {"STATE"},
                      {"ELAPSED", kNumber},
                      {"SIZE", kNumber},
                      {"RECORDED", kNumber},
                      {"DROPPED", kNumber}},
                     rows);
}

}  // namespace lumacast::ctl
