#pragma once
// What pictures are encoded with.

#include <array>
#include <string>
#include <vector>

#include "client/lumacastctl/doctor/Finding.h"

namespace lumacast::ctl {

/// The encoders in the order in which a recording tries them; the last one is software, and always enough.
inline constexpr std::array kEncoders{"h264_nvenc", "h264_vaapi", "libx264"};

struct EncoderFacts {
    std::string library;  ///< the encoding library's name
    bool isLoaded = false;
    std::vector<std::string> present;  ///< those of kEncoders that it has; hardware may still not open
    std::vector<std::string> devices;  ///< of graphics hardware, that this user may open
};

/// Loads the encoding library for as long as it takes, rather than with every run of the tool: it brings a hundred
/// others.
EncoderFacts probeEncoders();

Findings checkEncoders(const EncoderFacts& facts);

}  // namespace lumacast::ctl
