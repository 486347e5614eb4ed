#include "linux/system/FileLock.h"

#include <fcntl.h>

#include <cerrno>

namespace lumacast {

namespace {

struct flock wholeFile() {
    struct flock lock = {};
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    return lock;
}

}  // namespace

bool markBeingWritten(int file) {
    struct flock lock = wholeFile();
    return ::fcntl(file, F_OFD_SETLK, &lock) == 0 || (errno != EAGAIN && errno != EACCES);
}

bool isBeingWritten(int file) {
    struct flock lock = wholeFile();
    return ::fcntl(file, F_OFD_GETLK, &lock) == 0 && lock.l_type != F_UNLCK;
}

}  // namespace lumacast
