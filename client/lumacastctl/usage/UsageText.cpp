#include "client/lumacastctl/Table.h"
#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/usage/Usage.h"

namespace lumacast::ctl {

namespace {

std::string countText(const std::optional<std::uint64_t>& count) {
    return count ? std::to_string(*count) : "-";
}

/// Whole seconds: the daemon rounds.
std::string secondsText(const std::optional<double>& seconds) {
    if (!seconds) return "-";
    const std::string text = durationText(*seconds);
    return text.substr(0, text.find('.'));
}

std::string whyText(const UsageEntry& entry) {
    if (entry.daemonEnded) return "the daemon was told to end";
    return entry.endReason ? endReasonText(*entry.endReason) : "-";
}

std::vector<std::string> rowOf(const UsageEntry& entry) {
    return {entry.ended ? momentText(*entry.ended) : "-",
            entry.service.empty() ? "-" : printable(entry.service),
            secondsText(entry.activeSeconds),
            entry.width && entry.height ? countText(entry.width) + "x" + countText(entry.height) : "-",
            countText(entry.rate),
            countText(entry.frames),
            countText(entry.soundBuffers),
            countText(entry.microphoneBuffers),
            entry.fileBytes ? bytesText(*entry.fileBytes) : "-",
            whyText(entry)};
}

std::string counted(std::uint64_t count, const char* one, const char* several, const char* what) {
    if (count == 0) return "";
    return std::to_string(count) + (count == 1 ? one : several) + what + "\n";
}

}  // namespace

std::string usageText(const UsageReport& report) {
    constexpr auto kNumber = Column::Side::Right;
    std::vector<std::vector<std::string>> rows;
    for (const UsageEntry& entry : report.entries) rows.push_back(rowOf(entry));
    std::string text = rows.empty() ? "No recording has ended yet.\n"
                                    : tableText({{"ENDED"},
                                                 {"SERVICE"},
                                                 {"DURATION", kNumber},
                                                 {"PIXELS", kNumber},
                                                 {"RATE", kNumber},
                                                 {"FRAMES", kNumber},
                                                 {"SOUND", kNumber},
                                                 {"MIC", kNumber},
                                                 {"FILE", kNumber},
                                                 {"WHY"}},
                                                rows);
    text += counted(report.damagedLines, " line is", " lines are", " damaged and left out.");
    text += counted(report.unreadableFiles, " file", " files", " of the daemon's notes can't be read.");
    text += counted(report.lostEvents, " line was", " lines were",
                    " lost since the daemon was started: its state directory could not be written.");
    return text;
}

}  // namespace lumacast::ctl
