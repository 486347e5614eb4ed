#pragma once
#include <optional>
#include <string_view>

#include "base/Coder.h"
#include "base/Value.h"

namespace lumacast {

/// What a broadcast extension may impose on a broadcast in movie clips. A value; supports secure coding.
struct LCBroadcastConfiguration {
    static constexpr std::string_view kClassName = "LCBroadcastConfiguration";
    /// `supportsSecureCoding`
    static constexpr bool kSupportsSecureCoding = true;

    double clipDuration = 0.0;  ///< seconds; 0 means the default
    std::optional<Dictionary> videoCompressionProperties;

    /// `encodeWithCoder:` — an empty dictionary is left out, so it comes back as none.
    void encodeWithCoder(Coder& coder) const;
    /// `initWithCoder:` — none when a member is there but of another class.
    static std::optional<LCBroadcastConfiguration> initWithCoder(const Coder& coder);
};

}  // namespace lumacast
