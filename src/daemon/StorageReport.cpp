#include "daemon/StorageReport.h"

#include <algorithm>

namespace lumacast {

namespace {

/// More than a person reads; the answer is one line in memory.
constexpr std::size_t kMaximumFiles = 10'000;

struct File {
    std::string name;
    std::optional<FileAttributes> attributes;
    double modified() const { return attributes ? attributes->modified.secondsSince1970 : 0; }
};

}  // namespace

Dictionary storageReport(FileSystem& fileSystem, const TempStore& store, const std::optional<PurgeRecord>& purgeable,
                         const std::vector<std::string>& beingRecorded) {
    const auto listed = fileSystem.list(store._srTempPath());
    std::vector<File> files;
    if (const auto* names = std::get_if<std::vector<std::string>>(&listed)) {
        for (const std::string& name : *names) {
            if (files.size() == kMaximumFiles) break;
            const auto read = fileSystem.attributes(store.pathFor(name));
            const auto* attributes = std::get_if<FileAttributes>(&read);
            files.push_back({name, attributes ? std::optional(*attributes) : std::nullopt});
        }
    }
    std::stable_sort(files.begin(), files.end(),
                     [](const File& a, const File& b) { return a.modified() > b.modified(); });
    std::uint64_t bytes = 0;
    Array entries;
    for (const File& file : files) {
        const std::string path = store.pathFor(file.name);
        Dictionary entry{{"name", file.name}};
        if (file.attributes) {
            bytes += file.attributes->size;
            entry.set("bytes", file.attributes->size);
            entry.set("modified", file.attributes->modified);
        }
        entry.set("recording", std::find(beingRecorded.begin(), beingRecorded.end(), path) != beingRecorded.end());
        entries.emplace_back(std::move(entry));
    }
    Dictionary report{{"temporaryDirectory", store._srTempPath()},
                      {"freeBytes", store._srDeviceFreeDiskSpace()},
                      {"purgeableBytes", purgeable ? Value(purgeable->bytes) : Value()},
                      {"filesBytes", bytes},
                      {"files", std::move(entries)}};
    if (const auto* error = std::get_if<Error>(&listed))
        report.set("error", "the directory can't be listed: " + describe(*error));
    return report;
}

}  // namespace lumacast
