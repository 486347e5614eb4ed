#pragma once
#include <array>
#include <cstddef>
#include <vector>

namespace lumacast::extensions {

/// Two channels of samples, full scale is 1. Both are always as long as each other.
struct StereoSound {
    std::array<std::vector<float>, 2> channels;

    std::size_t size() const { return channels[0].size(); }
    void resize(std::size_t samples) {
        for (auto& channel : channels) channel.resize(samples);
    }
    void append(const StereoSound& more) {
        for (std::size_t at = 0; at < 2; ++at)
            channels[at].insert(channels[at].end(), more.channels[at].begin(), more.channels[at].end());
    }
    void dropFront(std::size_t samples) {
        for (auto& channel : channels)
            channel.erase(channel.begin(), channel.begin() + static_cast<std::ptrdiff_t>(samples));
    }
};

}  // namespace lumacast::extensions
