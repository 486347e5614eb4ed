#include "linux/library/LinuxPhotoLibrary.h"

#include <cerrno>

#include "linux/system/SystemError.h"

namespace lumacast {

Result<URL> LinuxPhotoLibrary::addVideo(const URL&, UserID) { return systemError(ENOTSUP); }

}  // namespace lumacast
