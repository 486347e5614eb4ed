#pragma once

#include <cstdint>

namespace lumacast::mp4 {

class BoxSource;

// What the first bytes of a file tell.
enum class FileHead : std::uint8_t {
    unreadable,   // the source says so
    notOurs,      // another file, or one that is too short
    unfinished,   // the reserve is one still: fragments follow
    halfSwitched, // the switch to the index was torn: the size is in force, the type is not whole
    finished,     // the reserve has become the head of the media data: `mediaEnd` is where the movie box begins
};

struct HeadView {
    FileHead head = FileHead::notOurs;
    std::uint64_t mediaEnd = 0;  // halfSwitched, finished
};
[[nodiscard]] HeadView readFileHead(BoxSource& source);

// A file's first bytes up to the movie box of the fragments.
inline constexpr std::uint64_t kFileStartBytes = 48;

}  // namespace lumacast::mp4
