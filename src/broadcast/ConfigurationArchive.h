#pragma once
#include <optional>

#include "broadcast/LCBroadcastConfiguration.h"
#include "platform/KeyedArchive.h"

namespace lumacast {

/// The configuration that an archive received from a client or an extension has as its root object; none when it does not
/// decode, or is of another class.
inline std::optional<LCBroadcastConfiguration> configurationIn(KeyedArchive& archives, const Data& archive) {
    const auto root = archives.unarchivedRoot(archive, LCBroadcastConfiguration::kClassName);
    return root ? LCBroadcastConfiguration::initWithCoder(DictionaryCoder(root->fields)) : std::nullopt;
}

/// The configuration as such an archive; none when it is over a limit.
inline std::optional<Data> archiveOf(KeyedArchive& archives, const LCBroadcastConfiguration& configuration) {
    DictionaryCoder coder;
    configuration.encodeWithCoder(coder);
    return archives.archivedData({std::string(LCBroadcastConfiguration::kClassName), coder.fields()});
}

}  // namespace lumacast
