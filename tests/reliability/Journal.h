#pragma once
// What changed a disk, in the order in which it did.

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace lumacast::test {

struct JournalEntry {
    enum class Kind : std::uint8_t { Make, MakeDirectory, Write, Sync, Rename, Remove };
    Kind kind = Kind::Make;
    std::string path;
    std::string newPath;  ///< of a rename
    std::uint64_t offset = 0;
    std::string bytes;
    std::uint64_t time = 0;  ///< host nanoseconds, when the call had been answered
};

inline std::string bytesAt(const void* bytes, ssize_t count) {
    return {static_cast<const char*>(bytes), static_cast<std::size_t>(count)};
}

/// As it stands in a journal file.
std::string encode(const JournalEntry& entry);

/// The entries of a journal file, in their order; none when it is not one. A last entry that is not whole is left out.
std::optional<std::vector<JournalEntry>> readJournal(const std::string& path);

}  // namespace lumacast::test
