#pragma once
#include <time.h>

#include <cstddef>

namespace lumacast {

/// Removes from an open folder the hidden files of saves that a process could not end (NewFile): regular files of this
/// user's with such a name, last changed before `before` (wall time), that nobody is writing. Answers how many. Blocks as
/// long as the disk does.
///
/// Another process of the daemon's may be saving into the same folder: its files bear its mark (system/FileLock.h). One
/// that is being made this moment has none yet, and is newer than `before`.
std::size_t removeStaleParts(int folder, const timespec& before);

}  // namespace lumacast
