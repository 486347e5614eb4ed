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
    std::optional<double> seconds;  ///< as a player shows it
    std::string state;              ///< for people; empty where the daemon says nothing
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

/// The daemon's answer to `storage` with what its answer to `movies` says of each file: `state`, which is beingRecorded or
/// beingWritten for those, and `seconds`. As it was where the second one says nothing, as of a daemon that doesn't know
/// the question.
std::string withMovies(const std::string& storage, std::string_view movies);

/// For people, several lines with a newline each.
std::string purgeableText(const StorageReport& report);
/// The files, a line each, the newest first as the daemon sends them: name, size, last change and how long ago that is
/// at `now` (seconds since 1970), length and state.
std::string filesText(const StorageReport& report, double now);
std::string purgeText(std::int32_t urgency, const PurgeOutcome& outcome);

}  // namespace lumacast::ctl
