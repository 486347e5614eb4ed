#pragma once
#include "platform/PhotoLibrary.h"

namespace lumacast {

/// There is no library yet.
class LinuxPhotoLibrary final : public PhotoLibrary {
public:
    Result<URL> addVideo(const URL& movie, UserID user) override;
};

}  // namespace lumacast
