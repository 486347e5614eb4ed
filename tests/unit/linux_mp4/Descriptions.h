#pragma once

#include "linux/media/mp4/MovieBoxWriter.h"
#include "tests/unit/linux_mp4/MemorySink.h"

namespace lumacast::mp4::test {

// A High profile sequence parameter set as an encoder wrote it (1920x1080), and a picture parameter set.
inline Bytes sequenceParameterSet() {
    return {0x67, 0x64, 0x00, 0x28, 0xAC, 0xD9, 0x40, 0x78, 0x02, 0x27, 0xE5, 0xC0,
            0x44, 0x00, 0x00, 0x03, 0x00, 0x04, 0x00, 0x00, 0x03, 0x00, 0xF0, 0x3C};
}
inline Bytes pictureParameterSet() {
    return {0x68, 0xEB, 0xE3, 0xCB, 0x22, 0xC0};
}

inline VideoTrackDescription videoDescription() {
    VideoTrackDescription track;
    track.width = 1920;
    track.height = 1080;
    track.sequenceParameterSets = {sequenceParameterSet()};
    track.pictureParameterSets = {pictureParameterSet()};
    return track;
}

inline AudioTrackDescription audioDescription(std::string name = "Application audio") {
    AudioTrackDescription track;
    track.sampleRate = 48000;
    track.channels = 2;
    track.audioSpecificConfig = {0x11, 0x90};
    track.primingFrames = 1024;
    track.bitRate = 128000;
    track.name = std::move(name);
    return track;
}

// Made-up payload, different for each number, so that a sample found at a wrong place is noticed.
inline Bytes payload(std::uint32_t number, std::size_t size) {
    Bytes bytes(size);
    std::uint32_t state = number * 2654435761U + 12345U;
    for (std::uint8_t& byte : bytes) {
        state = state * 1664525U + 1013904223U;
        byte = static_cast<std::uint8_t>(state >> 24U);
    }
    return bytes;
}

}  // namespace lumacast::mp4::test
