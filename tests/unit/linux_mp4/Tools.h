#pragma once

#include <filesystem>
#include <span>
#include <string>
#include <vector>

#include "tests/unit/linux_mp4/MemorySink.h"

namespace lumacast::mp4::test {

// A private directory, removed with everything in it at the end.
class TemporaryDirectory {
public:
    TemporaryDirectory();
    ~TemporaryDirectory();
    TemporaryDirectory(const TemporaryDirectory&) = delete;
    TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

    [[nodiscard]] std::filesystem::path path(const std::string& name) const { return root_ / name; }
    std::filesystem::path write(const std::string& name, std::span<const std::uint8_t> bytes) const;

private:
    std::filesystem::path root_;
};

struct ToolResult {
    int status = -1;  // what the program exited with; -1: it could not be run or was killed
    std::string output;
    std::string errors;
};

// Runs a program of the PATH to its end, its input closed.
[[nodiscard]] ToolResult runTool(const std::vector<std::string>& arguments);

// What the reference player makes of a movie, all tracks of it.
struct Played {
    int status = -1;                     // 0: nothing was wrong
    std::string errors;                  // what it complained about
    std::vector<std::int64_t> pictures;  // stamps of the decoded pictures, in ticks of the first track
};
// Stops at the first error.
[[nodiscard]] Played playStrictly(const std::filesystem::path& movie);
// The same from the key frame at `seconds` on.
[[nodiscard]] Played playStrictlyFrom(int seconds, const std::filesystem::path& movie);
// Goes on after errors, as players do.
[[nodiscard]] Played play(const std::filesystem::path& movie);

// One line a stream or the container: ffprobe's "key=value" fields joined by '|'.
[[nodiscard]] std::vector<std::string> probe(const std::filesystem::path& movie, const std::string& entries);

}  // namespace lumacast::mp4::test
