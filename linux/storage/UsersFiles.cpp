#include "linux/storage/UsersFiles.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>

#include "linux/calls/FileCalls.h"
#include "linux/storage/BeneathDirectory.h"

namespace lumacast {

namespace {

/// access() with the rights this thread has on files. The plain call asks for the process's own user, so it does where
/// that is who this thread acts for; the other one is Linux 5.8's.
int mayChange(int directory, uid_t user) {
    constexpr int kWanted = W_OK | X_OK;
    if (user == ::getuid() && user == ::geteuid()) return ::faccessat(directory, ".", kWanted, 0) == 0 ? 0 : errno;
    return ::syscall(SYS_faccessat2, directory, ".", kWanted, AT_EACCESS) == 0 ? 0 : errno;
}

/// What the kernel refuses to remove whoever asks.
bool isPinned(int directory, const std::string& name, std::uint64_t attributes) {
    struct statx status = {};
    if (::statx(directory, name.c_str(), AT_SYMLINK_NOFOLLOW | AT_EMPTY_PATH, STATX_TYPE, &status) != 0) return false;
    return (status.stx_attributes & attributes) != 0;
}

}  // namespace

int mayReadAndRemove(const std::string& path, uid_t user, const struct stat* notIn) {
    const auto place = resolveForUser(path, user);
    if (const int* error = std::get_if<int>(&place)) return *error;
    const auto& [folder, name] = std::get<ResolvedName>(place);

    struct stat file = {};
    struct stat around = {};
    if (::fstatat(folder.get(), name.c_str(), &file, AT_SYMLINK_NOFOLLOW) != 0) return errno;
    if (!S_ISREG(file.st_mode)) return S_ISDIR(file.st_mode) ? EISDIR : EACCES;
    const Fd opened(calls::openAt(folder.get(), name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    struct stat read = {};
    if (!opened || ::fstat(opened.get(), &read) != 0) return errno;
    if (read.st_ino != file.st_ino || read.st_dev != file.st_dev) return EACCES;  // exchanged meanwhile

    if (const int error = mayChange(folder.get(), user); error != 0) return error;
    if (::fstat(folder.get(), &around) != 0) return errno;
    if (notIn && notIn->st_dev == around.st_dev && notIn->st_ino == around.st_ino) return EACCES;
    const bool isSticky = (around.st_mode & S_ISVTX) != 0;
    if (isSticky && user != 0 && user != file.st_uid && user != around.st_uid) return EACCES;
    if (isPinned(folder.get(), name, STATX_ATTR_IMMUTABLE | STATX_ATTR_APPEND)) return EPERM;
    if (isPinned(folder.get(), "", STATX_ATTR_APPEND)) return EPERM;
    return 0;
}

int removeFile(const std::string& path, uid_t user) {
    const auto place = resolveForUser(path, user);
    if (const int* error = std::get_if<int>(&place)) return *error;
    const auto& [folder, name] = std::get<ResolvedName>(place);
    return calls::unlinkAt(folder.get(), name) == 0 ? 0 : errno;
}

}  // namespace lumacast
