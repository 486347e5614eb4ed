#pragma once
#include "platform/KeyedArchive.h"

namespace lumacast {

/// Archives as they travel between the processes of this system: for the daemon, and for what links the client or the
/// extension library. README.md has the layout.
class LinuxKeyedArchive final : public KeyedArchive {
public:
    std::optional<Data> archivedData(const ArchivedObject& root) override;
    std::optional<ArchivedObject> unarchivedRoot(const Data& archive, std::string_view allowedClass) override;
};

}  // namespace lumacast
