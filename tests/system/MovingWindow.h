#pragma once
// What an application of these tests shows: its options.

#include <string>
#include <vector>

namespace lumacast::test {

/// A small window with another picture thirty times a second.
inline const std::vector<std::string> kMoving{"--size", "320x180", "--fps", "30"};

/// The same where each picture is judged: larger, but small and slow for a sanitizer's daemon, which is many times slower.
#ifdef LC_SANITIZED
inline const std::vector<std::string> kJudged{"--size", "320x180", "--fps", "6"};
#else
inline const std::vector<std::string> kJudged{"--size", "640x360", "--fps", "30"};
#endif

}  // namespace lumacast::test
