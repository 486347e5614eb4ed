#pragma once
#include <sys/stat.h>
#include <sys/types.h>

#include <string>

namespace lumacast {

/// Whether the calling thread, which has `user`'s rights, may read the regular file at `path` and remove it from its
/// folder: 0, or the error number of what is in the way. A file directly in the folder `notIn`, under whatever name it
/// is reached, is EACCES. Nothing is changed, and no pipe or device is opened. Blocks as long as the disk does.
int mayReadAndRemove(const std::string& path, uid_t user, const struct stat* notIn = nullptr);

/// Removes what stands at `path`, but no directory, with the rights of the calling thread, which are `user`'s. 0 or the
/// error number. Blocks as long as the disk does.
int removeFile(const std::string& path, uid_t user);

}  // namespace lumacast
