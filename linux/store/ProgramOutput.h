#pragma once
#include <chrono>
#include <cstddef>
#include <optional>
#include <string>
#include <vector>

namespace lumacast {

/// A program to be run for what it writes.
struct ProgramRun {
    std::vector<std::string> command;      ///< the first is its path
    std::vector<std::string> environment;  ///< all of it, "NAME=value"
    std::size_t maximumBytes = 1024 * 1024;
    std::chrono::milliseconds patience{20'000};
};

/// What the program wrote to its standard output before it ended with status 0. None when it could not be run, failed,
/// wrote too much, took too long, or `cancel` (a descriptor) could be read before its end; it has gone in any case. Its
/// other standard files are empty. Blocks.
std::optional<std::string> outputOf(const ProgramRun& run, int cancel);

}  // namespace lumacast
