#pragma once
#include <optional>

#include "base/Value.h"

namespace lumacast {

/// What a broadcast extension may impose on a broadcast in movie clips. A value.
struct LCBroadcastConfiguration {
    double clipDuration = 0.0;  ///< seconds; 0 means the default
    std::optional<Dictionary> videoCompressionProperties;
};

}  // namespace lumacast
