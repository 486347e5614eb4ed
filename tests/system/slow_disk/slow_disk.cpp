// A disk that stops answering, or is full: preloaded into the shipped daemon, which knows nothing of it. Calls of the
// system that touch something below $LC_DISK wait as long as the file $LC_DISK_STALLED is there. Writes fail with ENOSPC
// as long as $LC_DISK_QUOTA or $LC_DISK_FULL is: the one still says that there is room, as a quota does, the other not.
//
// A file system of the test's own would need privileges and a kernel that lets it be mounted; this works for every user
// in every container. It waits where a file system would, in the call itself, in the middle of whatever thread makes it.

#include <dlfcn.h>
#include <fcntl.h>
#include <poll.h>
#include <stdarg.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

namespace {

const char* setting(const char* name) {
    const char* value = ::getenv(name);
    return value ? value : "";
}

/// Past every wrapper: the shim's own looks at the flags.
bool isThere(const char* path) { return *path != '\0' && ::syscall(SYS_faccessat, AT_FDCWD, path, F_OK) == 0; }

bool isBelow(const char* path) {
    const char* top = setting("LC_DISK");
    const std::size_t length = std::strlen(top);
    return length > 0 && std::strncmp(path, top, length) == 0 && (path[length] == '/' || path[length] == '\0');
}

std::string pathOf(int descriptor) {
    char link[64];
    std::snprintf(link, sizeof link, "/proc/self/fd/%d", descriptor);
    char target[4096];
    const ssize_t length = ::readlink(link, target, sizeof target - 1);
    return length > 0 ? std::string(target, static_cast<std::size_t>(length)) : std::string();
}

bool concerns(int descriptor) { return isBelow(pathOf(descriptor).c_str()); }

bool concerns(int folder, const char* path) {
    if (!path) return false;
    if (*path == '/') return isBelow(path);
    return folder >= 0 && isBelow((pathOf(folder) + (*path ? "/" : "") + path).c_str());
}

void stall() {
    while (isThere(setting("LC_DISK_STALLED"))) ::poll(nullptr, 0, 5);
}

bool isFull() { return isThere(setting("LC_DISK_FULL")); }
bool takesNothing() { return isFull() || isThere(setting("LC_DISK_QUOTA")); }

template <class Function>
Function next(const char* name) {
    return reinterpret_cast<Function>(::dlsym(RTLD_NEXT, name));
}

int modeOf(int flags, va_list arguments) {
    return (flags & (O_CREAT | O_TMPFILE)) != 0 ? static_cast<int>(va_arg(arguments, mode_t)) : 0;
}

ssize_t writeAt(const char* name, int descriptor, const void* bytes, std::size_t count, off_t offset) {
    if (concerns(descriptor)) {
        stall();
        if (takesNothing()) {
            errno = ENOSPC;
            return -1;
        }
    }
    return next<ssize_t (*)(int, const void*, std::size_t, off_t)>(name)(descriptor, bytes, count, offset);
}

int openAt(const char* name, int folder, const char* path, int flags, int mode) {
    if (concerns(folder, path)) stall();
    return next<int (*)(int, const char*, int, ...)>(name)(folder, path, flags, mode);
}

int openPath(const char* name, const char* path, int flags, int mode) {
    if (concerns(AT_FDCWD, path)) stall();
    return next<int (*)(const char*, int, ...)>(name)(path, flags, mode);
}

template <class Status>
int roomOf(int (*ask)(int, Status*), int descriptor, Status* status) {
    const bool isOurs = concerns(descriptor);
    if (isOurs) stall();
    const int result = ask(descriptor, status);
    if (isOurs && isFull()) status->f_bavail = status->f_bfree = 0;
    return result;
}

int synced(const char* name, int descriptor) {
    if (concerns(descriptor)) stall();
    return next<int (*)(int)>(name)(descriptor);
}

}  // namespace

extern "C" {

ssize_t pwrite(int descriptor, const void* bytes, size_t count, off_t offset) {
    return writeAt("pwrite", descriptor, bytes, count, offset);
}
ssize_t pwrite64(int descriptor, const void* bytes, size_t count, off64_t offset) {
    return writeAt("pwrite64", descriptor, bytes, count, offset);
}
int openat(int folder, const char* path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const int mode = modeOf(flags, arguments);
    va_end(arguments);
    return openAt("openat", folder, path, flags, mode);
}
int openat64(int folder, const char* path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const int mode = modeOf(flags, arguments);
    va_end(arguments);
    return openAt("openat64", folder, path, flags, mode);
}
int open(const char* path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const int mode = modeOf(flags, arguments);
    va_end(arguments);
    return openPath("open", path, flags, mode);
}
int open64(const char* path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const int mode = modeOf(flags, arguments);
    va_end(arguments);
    return openPath("open64", path, flags, mode);
}
int fsync(int descriptor) { return synced("fsync", descriptor); }
int fdatasync(int descriptor) { return synced("fdatasync", descriptor); }
int fstatvfs(int descriptor, struct statvfs* status) noexcept {
    return roomOf(next<int (*)(int, struct statvfs*)>("fstatvfs"), descriptor, status);
}
int fstatvfs64(int descriptor, struct statvfs64* status) noexcept {
    return roomOf(next<int (*)(int, struct statvfs64*)>("fstatvfs64"), descriptor, status);
}
int statx(int folder, const char* path, int flags, unsigned mask, struct statx* status) noexcept {
    if (concerns(folder, path)) stall();
    return next<int (*)(int, const char*, int, unsigned, struct statx*)>("statx")(folder, path, flags, mask, status);
}
int fstatat(int folder, const char* path, struct stat* status, int flags) noexcept {
    if (concerns(folder, path)) stall();
    return next<int (*)(int, const char*, struct stat*, int)>("fstatat")(folder, path, status, flags);
}
int lstat(const char* path, struct stat* status) noexcept {
    if (concerns(AT_FDCWD, path)) stall();
    return next<int (*)(const char*, struct stat*)>("lstat")(path, status);
}
int unlink(const char* path) noexcept {
    if (concerns(AT_FDCWD, path)) stall();
    return next<int (*)(const char*)>("unlink")(path);
}
int unlinkat(int folder, const char* path, int flags) noexcept {
    if (concerns(folder, path)) stall();
    return next<int (*)(int, const char*, int)>("unlinkat")(folder, path, flags);
}

}  // extern "C"
