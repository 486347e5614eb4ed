#pragma once
#include <string>
#include <vector>

namespace lumacast {

/// Arguments or an environment as exec and posix_spawn take them, with the null behind the last. They point into
/// `words`, which must live as long; nobody writes through them.
inline std::vector<char*> pointersTo(const std::vector<std::string>& words) {
    std::vector<char*> pointers;
    pointers.reserve(words.size() + 1);
    for (const std::string& word : words) pointers.push_back(const_cast<char*>(word.c_str()));
    pointers.push_back(nullptr);
    return pointers;
}

}  // namespace lumacast
