#include <algorithm>

#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/storage/Storage.h"

namespace lumacast::ctl {

namespace {

std::string padded(std::string text, std::size_t width) {
    text.resize(std::max(width, text.size()), ' ');
    return text;
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

std::string filesText(const StorageReport& report) {
    if (report.files.empty()) return "There are no temporary movies.\n";
    std::size_t widestName = 0, widestSize = 0;
    const auto sizeOf = [](const TemporaryFile& file) { return file.bytes ? bytesText(*file.bytes) : "unknown"; };
    for (const TemporaryFile& file : report.files) {
        widestName = std::max(widestName, printable(file.name).size());
        widestSize = std::max(widestSize, sizeOf(file).size());
    }
    std::string text;
    for (const TemporaryFile& file : report.files) {
        text += padded(printable(file.name), widestName) + "  " + padded(sizeOf(file), widestSize) + "  ";
        text += file.modified ? momentText(*file.modified) : "unknown";
        text += file.isBeingRecorded ? "  being recorded\n" : "\n";
    }
    return text;
}

std::string purgeText(std::int32_t urgency, const PurgeOutcome& outcome) {
    const std::string asked = "Purge at urgency " + std::to_string(urgency) + ": ";
    if (outcome.freedBytes) return asked + bytesText(*outcome.freedBytes) + " given back.\n";
    return asked + "nothing was to be given back. Below urgency 3 files go only when a recording has just ended.\n";
}

}  // namespace lumacast::ctl
