#pragma once
#include <sys/types.h>

#include <string>

namespace lumacast {

/// Whether the calling thread, which has `user`'s rights, may read the regular file at `path` and remove it from its
/// folder: 0, or the error number of what is in the way. Nothing is changed, and no pipe or device is opened. Blocks as
/// long as the disk does.
int mayReadAndRemove(const std::string& path, uid_t user);

/// Removes what stands at `path`, but no directory, with the rights of the calling thread, which are `user`'s. 0 or the
/// error number. Blocks as long as the disk does.
int removeFile(const std::string& path, uid_t user);

}  // namespace lumacast
