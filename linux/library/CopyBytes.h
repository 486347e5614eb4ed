#pragma once
#include <cstdint>

namespace lumacast {

/// The first way that is tried; what the file systems can't do falls back to the next one.
enum class CopyBy {
    Clone,   ///< both files share the bytes (ioctl FICLONE)
    Kernel,  ///< copy_file_range
    Hand,    ///< read and write
};

/// Copies a regular file of `size` bytes, and what was added since, to an empty file. The room is asked for at the start,
/// so that a full disk is an error at once. Written-back as it goes on, never more than some megabytes behind: not one
/// long burst at the end. 0 or the error number (ENOSPC, EDQUOT, EFBIG, EIO; EIO also when the file has become shorter).
/// Short and interrupted writes go on. Blocks as long as the disks do.
[[nodiscard]] int copyBytes(int from, int to, std::uint64_t size, CopyBy first);

}  // namespace lumacast
