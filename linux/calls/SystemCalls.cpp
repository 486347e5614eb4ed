#include "linux/calls/SystemCalls.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <stdio.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace lumacast::calls::once {

int openAt(int folder, const std::string& path, int flags, mode_t mode) {
    return ::openat(folder, path.c_str(), flags, mode);
}

int openResolved(int folder, const std::string& path, const open_how& how) {
    return static_cast<int>(::syscall(SYS_openat2, folder, path.c_str(), &how, sizeof how));
}

int makeDirectoryAt(int folder, const std::string& path, mode_t mode) { return ::mkdirat(folder, path.c_str(), mode); }

ssize_t write(int file, const void* bytes, std::size_t count) { return ::write(file, bytes, count); }

ssize_t writeAt(int file, const void* bytes, std::size_t count, off_t offset) {
    return ::pwrite(file, bytes, count, offset);
}

ssize_t copyRange(int from, int to, std::size_t count) {
    return ::copy_file_range(from, nullptr, to, nullptr, count, 0);
}

int clone(int from, int to) { return ::ioctl(to, FICLONE, from); }

int reserve(int file, off_t size) { return ::fallocate(file, FALLOC_FL_KEEP_SIZE, 0, size); }

int truncate(int file, off_t size) { return ::ftruncate(file, size); }

int sync(int file) { return ::fsync(file); }

int syncData(int file) { return ::fdatasync(file); }

int startWriteBack(int file, off_t offset, off_t count, unsigned flags) {
    return ::sync_file_range(file, offset, count, flags);
}

int rename(int fromFolder, const std::string& from, int toFolder, const std::string& to) {
    return ::renameat(fromFolder, from.c_str(), toFolder, to.c_str());
}

int renameToNew(int fromFolder, const std::string& from, int toFolder, const std::string& to) {
    return ::renameat2(fromFolder, from.c_str(), toFolder, to.c_str(), RENAME_NOREPLACE);
}

int link(int fromFolder, const std::string& from, int toFolder, const std::string& to, int flags) {
    return ::linkat(fromFolder, from.c_str(), toFolder, to.c_str(), flags);
}

int unlinkAt(int folder, const std::string& path, int flags) { return ::unlinkat(folder, path.c_str(), flags); }

int statFileSystem(int file, struct statvfs& status) { return ::fstatvfs(file, &status); }

ssize_t sendMessage(int socket, const msghdr& message, int flags) { return ::sendmsg(socket, &message, flags); }

}  // namespace lumacast::calls::once
