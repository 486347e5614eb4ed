#pragma once
#include <sys/stat.h>

#include <string>

namespace lumacast {

/// The permissions of a file; 0 where there is none.
inline mode_t modeOf(const std::string& path) {
    struct stat status = {};
    return ::stat(path.c_str(), &status) == 0 ? status.st_mode & 07777 : 0;
}

}  // namespace lumacast
