#pragma once
#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace lumacast::sound {

/// A short sound, ready to be played.
struct EventSound {
    static constexpr int kRate = 48000;
    static constexpr std::size_t kChannels = 2;
    static constexpr std::chrono::seconds kLongest{5};

    std::string name;                ///< by the naming specification, e.g. "camera-shutter"
    std::vector<float> samples;      ///< interleaved, -1 to 1
    std::shared_ptr<void> inFlight;  ///< kept until it has been played or given up

    std::chrono::milliseconds length() const {
        return std::chrono::milliseconds(samples.size() / kChannels * 1000 / kRate);
    }
};

/// The samples of an Ogg or WAVE file, cut at the longest length; none for anything else, for what can't be decoded and
/// for files of more than 4 MiB. Blocks as long as the disk does.
std::optional<std::vector<float>> readSoundFile(const std::string& path);

/// A short tone that goes up from `first` to `last` Hz, or down: for devices without a sound theme.
std::vector<float> glidingTone(double first, double last);

}  // namespace lumacast::sound
