#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace lumacast::mp4 {

// A microsecond a tick: a nanosecond stamp is moved by half a microsecond at most, and one picture may stand for 71
// minutes before its duration outgrows the 32 bits the tables have for it.
inline constexpr std::uint32_t kDefaultVideoTimescale = 1'000'000;

// x' = a*x + c*y + tx, y' = b*x + d*y + ty, in pixels, y downwards: how the coded picture is laid on the screen.
// Translations reach ±32767 pixels and coefficients ±32767 (16.16 fixed point in the file); beyond that they are
// clamped.
struct AffineTransform {
    double a = 1;
    double b = 0;
    double c = 0;
    double d = 1;
    double tx = 0;
    double ty = 0;
};

// Code points of ISO/IEC 23091-2 (the same numbers as in the H.264 VUI).
struct ColourDescription {
    std::uint16_t primaries = 6;  // SMPTE 170M
    std::uint16_t transfer = 6;   // SMPTE 170M
    std::uint16_t matrix = 6;     // SMPTE 170M, known as BT.601
    bool fullRange = false;
};

struct PixelAspectRatio {
    std::uint32_t horizontal = 1;
    std::uint32_t vertical = 1;
};

// H.264 with pictures in decoding order equal to presentation order (no B-pictures). Samples are NAL units with 4-byte
// lengths.
struct VideoTrackDescription {
    std::uint16_t width = 0;  // pixels of the cropped coded picture
    std::uint16_t height = 0;
    std::uint32_t timescale = kDefaultVideoTimescale;  // ticks per second of the stamps
    // NAL units without start code or length, at least one of each.
    std::vector<std::vector<std::uint8_t>> sequenceParameterSets;
    std::vector<std::vector<std::uint8_t>> pictureParameterSets;
    AffineTransform transform;
    std::optional<ColourDescription> colour = ColourDescription{};
    std::optional<PixelAspectRatio> pixelAspectRatio;
    std::string name = "Screen";  // UTF-8, shown by players as the track's name
};

// AAC. The track's timescale is its sample rate. Stamps count the priming too: the first packet's is `primingFrames`
// before the time of the first real frame, and may be negative. Give stamps counted in frames, not converted from
// nanoseconds one by one.
struct AudioTrackDescription {
    std::uint32_t sampleRate = 0;  // frames per second
    std::uint16_t channels = 0;
    std::vector<std::uint8_t> audioSpecificConfig;  // ISO/IEC 14496-3 clause 1.6.2, 2 to 64 bytes
    std::uint32_t primingFrames = 0;  // what the encoder put before the first real frame; an edit list hides it
    std::uint32_t bitRate = 0;        // bits per second on average, 0: not known
    std::string name;                 // "Application audio", "Microphone"
};

}  // namespace lumacast::mp4
