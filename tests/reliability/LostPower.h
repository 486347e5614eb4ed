#pragma once
// What is on a disk after the power went.

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "tests/reliability/Journal.h"

namespace lumacast::test {

/// A disk that has been told everything in a journal up to some entry, and then lost its power. A file's bytes are sure to be there
/// once the file was synced after they were written; its name once its folder was. What was written since is there in whole
/// sectors or not at all, in any order, and a sector that was being written may be half there.
class LostPower {
public:
    static constexpr std::size_t kSector = 512;

    /// What became of what had not been synced.
    enum class Rest {
        Gone,    ///< nothing of it is there
        There,   ///< all of it is, but for the last write, which is torn within its last sector
        Zeros,   ///< the files have their new lengths, and zeros in place of the bytes
        Any,     ///< some sectors are there and some are not
    };

    void add(const JournalEntry& entry);
    /// The files below `folder` by name. `seed` is for Rest::Any.
    std::map<std::string, std::string> filesBelow(const std::string& folder, Rest rest, std::uint32_t seed) const;

private:
    struct Write {
        std::uint64_t offset = 0;
        std::string bytes;
    };
    struct File {
        std::string synced;
        std::vector<Write> since;
        bool isNameSynced = false;
        std::optional<std::string> nameBefore;  ///< what it was renamed from, until the folder is synced
    };

    std::map<std::string, std::shared_ptr<File>> files_;
    std::map<std::string, std::shared_ptr<File>> removed_;  ///< whose removal may not be on the disk yet
};

}  // namespace lumacast::test
