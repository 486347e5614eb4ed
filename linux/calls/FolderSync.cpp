#include "linux/calls/FolderSync.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "linux/calls/FileCalls.h"

namespace lumacast {

int syncFolder(int folder) {
    // What only names a folder (O_PATH) can't be synced.
    const int readable = calls::openAt(folder, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (readable < 0) return errno == EACCES ? 0 : errno;
    const int error = calls::sync(readable) == 0 ? 0 : errno;
    ::close(readable);
    return error == EINVAL || error == EROFS ? 0 : error;
}

}  // namespace lumacast
