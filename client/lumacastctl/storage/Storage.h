#pragma once
// The temporary movies, as the daemon's administrator reads of them.

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace lumacast::ctl {

struct TemporaryFile {
    std::string name;
    std::optional<std::uint64_t> bytes;
    std::optional<double> modified;  ///< seconds since 1970
    bool isBeingRecorded = false;
};

struct StorageReport {
    std::string temporaryDirectory;
    std::uint64_t freeBytes = 0;                  ///< 0 when the daemon can't tell
    std::optional<std::uint64_t> purgeableBytes;  ///< as the daemon tells its purge service
    std::uint64_t filesBytes = 0;                 ///< of all files together
    std::vector<TemporaryFile> files;
};

/// What a purge has given back; none for nothing at all.
struct PurgeOutcome {
    std::optional<std::uint64_t> freedBytes;
};

/// Read the daemon's answers to `storage` and `purge`. Else why it is none, for people: the daemon's own error, or that
/// the answer can't be understood. Pure; entries that are unknown are passed over.
std::variant<StorageReport, std::string> readStorage(std::string_view answer);
std::variant<PurgeOutcome, std::string> readPurge(std::string_view answer);

/// For people, several lines with a newline each.
std::string purgeableText(const StorageReport& report);
/// The files, a line each, the newest first as the daemon sends them.
std::string filesText(const StorageReport& report);
std::string purgeText(std::int32_t urgency, const PurgeOutcome& outcome);

}  // namespace lumacast::ctl
