#pragma once
#include <cstdint>

namespace lumacast {

/// What a capture source reports when it fails.
struct CaptureStatus {
    static constexpr std::int32_t kNoDisplay = -1;     ///< no display server, or not on this machine
    static constexpr std::int32_t kNotSupported = -2;  ///< the server lacks an extension, or a size no frame can have
    static constexpr std::int32_t kWindowGone = -3;    ///< none of the wanted windows exists (any more)
    static constexpr std::int32_t kDisplayLost = -4;   ///< the display server has gone while capturing
    static constexpr std::int32_t kNoThread = -5;      ///< the system has no thread to capture on
};

}  // namespace lumacast
