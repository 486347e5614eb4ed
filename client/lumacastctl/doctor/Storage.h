#pragma once
// The temporary directory, in which movies are recorded.

#include <cstdint>
#include <optional>
#include <string>

#include "client/lumacastctl/doctor/Finding.h"

namespace lumacast::ctl {

/// The temporary directory below the root directory; as the daemon's file system has it.
inline constexpr std::string_view kTemporaryDirectory = "/private/var/mobile/Library/Lumacast";

/// More than this must be free where it is, or starts are refused. Bytes.
inline constexpr std::uint64_t kNeededFreeBytes = 100'000'000;

struct StorageFacts {
    enum class State { Missing, Directory, SomethingElse };
    std::string path;
    State state = State::Missing;
    std::string nearest;      ///< the directory itself, or the nearest one above it that exists
    bool isWritable = false;  ///< `nearest`, by this user
    std::optional<std::uint64_t> freeBytes;  ///< where `nearest` is
    std::optional<std::string> daemonsPath;  ///< what the running daemon uses; none when none answers
};

/// `root` as LinuxEnvironment has it; `daemonsPath` from the daemon's status. Blocks as long as the disk does.
StorageFacts probeStorage(const std::string& root, const std::optional<std::string>& daemonsPath);

Findings checkStorage(const StorageFacts& facts);

}  // namespace lumacast::ctl
