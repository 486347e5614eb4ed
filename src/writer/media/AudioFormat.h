#pragma once
#include <cstdint>

namespace lumacast {

/// A four-character code, e.g. fourCC("lpcm").
constexpr std::uint32_t fourCC(const char (&code)[5]) {
    return static_cast<std::uint32_t>(static_cast<unsigned char>(code[0])) << 24 |
           static_cast<std::uint32_t>(static_cast<unsigned char>(code[1])) << 16 |
           static_cast<std::uint32_t>(static_cast<unsigned char>(code[2])) << 8 |
           static_cast<std::uint32_t>(static_cast<unsigned char>(code[3]));
}

/// The description of an audio stream. Plain data: this is also its layout where it leaves the process (40 bytes).
struct AudioFormat {
    static constexpr std::uint32_t kFlagFloat = 1u << 0;
    static constexpr std::uint32_t kFlagBigEndian = 1u << 1;
    static constexpr std::uint32_t kFlagSignedInteger = 1u << 2;
    static constexpr std::uint32_t kFlagPacked = 1u << 3;

    double sampleRate = 0;  ///< frames per second
    std::uint32_t formatID = 0;
    std::uint32_t formatFlags = 0;
    std::uint32_t bytesPerPacket = 0;
    std::uint32_t framesPerPacket = 0;
    std::uint32_t bytesPerFrame = 0;
    std::uint32_t channelsPerFrame = 0;
    std::uint32_t bitsPerChannel = 0;
    std::uint32_t reserved = 0;

    bool operator==(const AudioFormat&) const = default;
};
static_assert(sizeof(AudioFormat) == 40);

inline constexpr std::uint32_t kAudioFormatLinearPCM = fourCC("lpcm");
inline constexpr std::uint32_t kAudioFormatAAC = fourCC("aac ");

}  // namespace lumacast
