#pragma once
// What the daemon says of a movie that is being saved to the user's library.

#include <cstdint>
#include <string>
#include <string_view>
#include <variant>

#include "base/Value.h"

namespace lumacast::ctl {

enum class SaveState { Mixing, Adding, Saved, Failed };

struct SaveProgress {
    SaveState state = SaveState::Mixing;
    double part = 0;      ///< of the mixing, 0 to 1
    std::string savedAs;  ///< where the copy is, once it is saved
    std::string error;    ///< why it failed
    Dictionary entry;     ///< the daemon's own words
};

/// The file URL of an absolute path, everything encoded but letters, digits, "-", ".", "_", "~" and "/" (RFC 3986,
/// 2.1): one word.
std::string fileURL(std::string_view path);

/// Reads the answer to `save`: the number of the save, else why there is none, for people. Pure.
std::variant<std::uint64_t, std::string> readSaveNumber(std::string_view answer);

/// The daemon has no time to say how far a save is; it may have later.
struct SaveUnseen {};

/// Reads how far the save with this number is from the answer to `saves`; else why it can't be told. Pure.
std::variant<SaveProgress, SaveUnseen, std::string> readSaveProgress(std::string_view answer, std::uint64_t number);

/// "mixing   [############                  ]  40 %": a line without its end.
std::string progressBar(const SaveProgress& progress);

}  // namespace lumacast::ctl
