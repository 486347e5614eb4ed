#pragma once
#include <sys/stat.h>

#include <cstddef>
#include <optional>
#include <string>

namespace lumacast {

/// A whole small file, and what the system knew of it when it was opened.
struct SmallFile {
    std::string text;
    struct stat status = {};
};

/// Reads a regular file of at most `maximumBytes`. None for anything else: missing, unreadable, a directory, a pipe or
/// a device (which are never waited for), or larger. Links are followed. Blocks as long as the disk does.
std::optional<SmallFile> readSmallFile(const std::string& path, std::size_t maximumBytes);

}  // namespace lumacast
