#pragma once
#include "base/Identifiers.h"
#include "platform/FileSystem.h"

namespace lumacast {

/// The user's library of pictures and movies.
class PhotoLibrary {
public:
    virtual ~PhotoLibrary() = default;
    /// Adds a copy of a movie as a new video asset and answers, once that is safely on the disk, where it is. Never
    /// replaces anything, and leaves nothing behind when it fails (ENOSPC, EACCES, ...): then the library is as it was.
    /// `user` is whose library it is, and with whose rights it is written. Waits for the disk: on a global queue only.
    virtual Result<URL> addVideo(const URL& movie, UserID user) = 0;
};

}  // namespace lumacast
