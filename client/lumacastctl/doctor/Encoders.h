#pragma once
// What pictures are encoded with.

#include <array>
#include <string>
#include <vector>

#include "client/lumacastctl/doctor/Finding.h"

namespace lumacast::ctl {

/// The encoders of the encoding library: hardware in the order in which a recording tries it, then the software that
/// saving uses.
inline constexpr std::array kEncoders{"h264_nvenc", "h264_vaapi", "libx264"};

/// The software that a recording of this build encodes with, after hardware.
#ifdef LC_CTL_OPENH264
inline constexpr char kLiveSoftware[] = "libopenh264";
#else
inline constexpr char kLiveSoftware[] = "libx264";
#endif
/// What a save with the sound mixed encodes its pictures with, in every build.
inline constexpr char kSavingSoftware[] = "libx264";

struct EncoderFacts {
    std::string library;  ///< the encoding library's name
    bool isLoaded = false;
    std::vector<std::string> present;      ///< those of kEncoders that it has; hardware may still not open
    std::vector<std::string> devices;      ///< of graphics hardware, that this user may open
    std::string software = kLiveSoftware;  ///< what recordings encode with after hardware
    /// The library of `software` where it is one of its own, and whether it can be loaded.
    std::string ownLibrary;
    bool ownIsLoaded = false;
};

/// Loads the encoding library for as long as it takes, rather than with every run of the tool: it brings a hundred
/// others.
EncoderFacts probeEncoders();

Findings checkEncoders(const EncoderFacts& facts);

}  // namespace lumacast::ctl
