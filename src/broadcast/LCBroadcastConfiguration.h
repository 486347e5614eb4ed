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
    /// How the clips' pictures are compressed; what is left out is as the daemon does it. Numbers of any kind, kept
    /// within what an encoder can do: "AverageBitRate" (bits a second), "ExpectedSourceFrameRate" (pictures a second at
    /// most), "MaxKeyFrameInterval" (pictures; there is a key frame each second whatever it says). "ProfileLevel" is a
    /// text that begins with "H264_". Other keys do nothing; where one of these is of another kind no clip can be made.
    std::optional<Dictionary> videoCompressionProperties;

    /// `encodeWithCoder:` — an empty dictionary is left out, so it comes back as none.
    void encodeWithCoder(Coder& coder) const;
    /// `initWithCoder:` — none when a member is there but of another class.
    static std::optional<LCBroadcastConfiguration> initWithCoder(const Coder& coder);
};

}  // namespace lumacast
