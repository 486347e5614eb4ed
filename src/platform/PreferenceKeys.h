#pragma once
// The preferences of this daemon: the one table. Their domain and how a switch is read stand in Preferences.h.

#include <array>
#include <string_view>

namespace lumacast {

inline constexpr std::string_view kSuppressAlertKey = "LCSuppressAlert";
inline constexpr std::string_view kFullResCaptureKey = "LCFullResCapture";
inline constexpr std::string_view kBitRateOverrideKey = "LCBitRateOverride";

struct PreferenceRow {
    std::string_view key;
    std::string_view kind;     ///< what is written behind the key
    std::string_view meaning;  ///< what it does
    std::string_view without;  ///< what happens without it
};

inline constexpr std::array kPreferenceTable{
    PreferenceRow{kSuppressAlertKey, "yes or no", "applications record without the user being asked",
                  "the user is asked before an application's first recording"},
    PreferenceRow{kFullResCaptureKey, "yes or no", "a movie keeps the full size of what is recorded",
                  "its longer side has at most 1920 pixels, on devices of reduced capture 1600"},
    PreferenceRow{kBitRateOverrideKey, "bits per second", "the average bit rate of the picture, whatever its size",
                  "3,000,000; 5,000,000 from 1920 pixels on; 7,000,000 on a tablet"},
};

}  // namespace lumacast
