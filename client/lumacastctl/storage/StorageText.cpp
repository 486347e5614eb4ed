#include <algorithm>
#include <vector>

#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/storage/Storage.h"

namespace lumacast::ctl {

namespace {

std::string padded(std::string text, std::size_t width) {
    text.resize(std::max(width, text.size()), ' ');
    return text;
}

/// "12 s", "5 min", "3 h", "2 days": whole ones, cut off.
std::string ageText(double seconds) {
    constexpr double kMinute = 60, kHour = 60 * kMinute, kDay = 24 * kHour, kLongest = 1e12;
    const double age = std::clamp(seconds, 0.0, kLongest);
    const auto in = [age](double unit, const char* name) {
        return std::to_string(static_cast<long long>(age / unit)) + name;
    };
    if (age < kMinute) return in(1, " s");
    if (age < kHour) return in(kMinute, " min");
    return age < 2 * kDay ? in(kHour, " h") : in(kDay, " days");
}

/// What is known of a file, column by column.
std::vector<std::string> rowOf(const TemporaryFile& file, double now) {
    return {printable(file.name),
            file.bytes ? bytesText(*file.bytes) : "unknown",
            file.modified ? momentText(*file.modified) : "unknown",
            file.modified ? ageText(now - *file.modified) : "",
            file.seconds ? durationText(*file.seconds) : "",
            file.state};
}

}  // namespace

std::string purgeableText(const StorageReport& report) {
    std::string text = "Purgeable:  ";
    text += report.purgeableBytes ? bytesText(*report.purgeableBytes) + ", the directory's own entry" : "unknown";
    text += "\nMovies:     " + bytesText(report.filesBytes) + " in " + std::to_string(report.files.size()) +
            (report.files.size() == 1 ? " file" : " files");
    // The daemon says 0 for a place it can't ask.
    text += "\nFree space: " + (report.freeBytes == 0 ? std::string("unknown, or none") : bytesText(report.freeBytes));
    if (!report.temporaryDirectory.empty()) text += " in " + printable(report.temporaryDirectory);
    return text + "\n";
}

std::string filesText(const StorageReport& report, double now) {
    if (report.files.empty()) return "There are no temporary movies.\n";
    std::vector<std::vector<std::string>> rows;
    std::vector<std::size_t> widths;
    for (const TemporaryFile& file : report.files) {
        rows.push_back(rowOf(file, now));
        widths.resize(rows.back().size());
        for (std::size_t i = 0; i < widths.size(); ++i) widths[i] = std::max(widths[i], rows.back()[i].size());
    }
    std::string text;
    for (const auto& row : rows) {
        std::string line;
        for (std::size_t i = 0; i < row.size(); ++i)
            if (widths[i] > 0) line += padded(row[i], widths[i]) + "  ";
        line.resize(line.find_last_not_of(' ') + 1);
        text += line + "\n";
    }
    return text;
}

std::string purgeText(std::int32_t urgency, const PurgeOutcome& outcome) {
    const std::string asked = "Purge at urgency " + std::to_string(urgency) + ": ";
    if (outcome.freedBytes) return asked + bytesText(*outcome.freedBytes) + " given back.\n";
    return asked + "nothing was to be given back. Below urgency 3 files go only when a recording has just ended.\n";
}

}  // namespace lumacast::ctl
