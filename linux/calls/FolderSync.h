#pragma once

namespace lumacast {

/// Brings the names in a folder onto the disk: what was made, renamed or removed there before is so for good. `folder`
/// is a descriptor of any kind, or AT_FDCWD. 0, or the error number; 0 too for a file system that has nothing to sync in
/// a folder, and for a folder that may not be read. Blocks as long as the disk does.
int syncFolder(int folder);

}  // namespace lumacast
