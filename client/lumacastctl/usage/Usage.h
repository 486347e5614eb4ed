#pragma once
// The recordings that have ended, as the daemon's telemetry has noted them.

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace lumacast::ctl {

/// One recording. What its line does not tell is none.
struct UsageEntry {
    std::optional<double> ended;  ///< seconds since 1970
    std::string service;          ///< what kind of recording it was; empty when the line has none
    std::optional<double> activeSeconds;
    std::optional<std::uint64_t> width, height;  ///< pixels
    std::optional<std::uint64_t> rate;           ///< frames a second, at most
    std::optional<std::uint64_t> frames;
    std::optional<std::uint64_t> soundBuffers;  ///< of the application
    std::optional<std::uint64_t> microphoneBuffers;
    std::optional<std::uint64_t> fileBytes;
    std::optional<std::int64_t> endReason;
    bool daemonEnded = false;  ///< the daemon closed the movie because it was told to end
};

struct UsageReport {
    std::vector<UsageEntry> entries;    ///< the oldest first
    std::uint64_t damagedLines = 0;     ///< left out
    std::uint64_t unreadableFiles = 0;  ///< of the two
    std::uint64_t lostEvents = 0;       ///< since the daemon was started
};

/// Reads the daemon's answer to `usage`; else why it is none, for people. Pure. Events of other kinds are passed over.
std::variant<UsageReport, std::string> readUsage(std::string_view answer);

/// Why a recording ended, in words: 0, a recording error's code, or anything else.
std::string endReasonText(std::int64_t code);

/// The table, the newest last, and what is missing from it.
std::string usageText(const UsageReport& report);

}  // namespace lumacast::ctl
