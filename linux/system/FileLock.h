#pragma once

namespace lumacast {

/// Marks an open file (for writing) as one that is being written, until every copy of the descriptor is closed, by
/// whatever end. False when another open file of it has the mark. Where the file system knows no such marks the answer
/// is true. Doesn't wait. An open-file-description lock of the whole file (fcntl(2), F_OFD_SETLK).
bool markBeingWritten(int file);

/// Whether another open file of it, in this process or another, has the mark. Changes nothing.
bool isBeingWritten(int file);

}  // namespace lumacast
