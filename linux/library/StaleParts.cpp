#include "linux/library/StaleParts.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "linux/calls/FileCalls.h"
#include "linux/ipc/Fd.h"
#include "linux/library/NewFile.h"
#include "linux/system/FileLock.h"

namespace lumacast {

namespace {

std::vector<std::string> partsIn(int folder) {
    std::vector<std::string> names;
    Fd list(calls::openAt(folder, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    DIR* const entries = list ? ::fdopendir(list.get()) : nullptr;
    if (!entries) return names;
    (void)list.release();  // it is closed with the stream
    while (const dirent* const entry = ::readdir(entries)) {
        if (isHiddenName(entry->d_name)) names.emplace_back(entry->d_name);
    }
    ::closedir(entries);
    return names;
}

bool isEarlier(const timespec& a, const timespec& b) {
    return a.tv_sec != b.tv_sec ? a.tv_sec < b.tv_sec : a.tv_nsec < b.tv_nsec;
}

bool isStale(const Fd& file, const timespec& before) {
    struct stat status = {};
    return file && ::fstat(file.get(), &status) == 0 && S_ISREG(status.st_mode) && status.st_uid == ::geteuid() &&
           isEarlier(status.st_ctim, before) && !isBeingWritten(file.get());
}

}  // namespace

std::size_t removeStaleParts(int folder, const timespec& before) {
    std::size_t count = 0;
    for (const std::string& name : partsIn(folder)) {
        const Fd file(calls::openAt(folder, name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
        // Such a name is a number of 64 bits by chance: nobody gives it to another file meanwhile.
        if (isStale(file, before) && calls::unlinkAt(folder, name) == 0) ++count;
    }
    return count;
}

}  // namespace lumacast
