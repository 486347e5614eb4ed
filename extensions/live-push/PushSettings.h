#pragma once
#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

#include "base/Value.h"

namespace lumacast::extensions {

/// What an application asks for in its user info; README.md has the keys.
struct PushSettings {
    std::string url;
    std::optional<std::string> viewURL;
    int width = 1920, height = 1080;  ///< the stream's pictures fit into this; even
    std::int64_t bitRate = 4'000'000;
    std::chrono::seconds giveUpAfter{60};

    /// None without a URL that can be pushed to.
    static std::optional<PushSettings> from(const Dictionary& info);
    /// What libav calls the stream's form: "flv" or "mpegts".
    const char* formatName() const;
};

}  // namespace lumacast::extensions
