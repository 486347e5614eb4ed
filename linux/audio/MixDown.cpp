#include "linux/audio/MixDown.h"

#include <pulse/channelmap.h>

#include <algorithm>

namespace lumacast::sound {

namespace {

constexpr float kMiddleOfTwo = 0.7f;

float weightOf(Side side, Side output) {
    if (side == Side::None) return 0;
    if (output == Side::Middle) return 1;
    if (side == Side::Middle) return kMiddleOfTwo;
    return side == output ? 1.0f : 0.0f;
}

}  // namespace

std::vector<Side> sidesOf(const std::vector<std::int32_t>& positions) {
    std::vector<Side> sides;
    for (const std::int32_t position : positions) {
        switch (position) {
            case PA_CHANNEL_POSITION_FRONT_LEFT:
            case PA_CHANNEL_POSITION_REAR_LEFT:
            case PA_CHANNEL_POSITION_FRONT_LEFT_OF_CENTER:
            case PA_CHANNEL_POSITION_SIDE_LEFT:
            case PA_CHANNEL_POSITION_TOP_FRONT_LEFT:
            case PA_CHANNEL_POSITION_TOP_REAR_LEFT: sides.push_back(Side::Left); break;
            case PA_CHANNEL_POSITION_FRONT_RIGHT:
            case PA_CHANNEL_POSITION_REAR_RIGHT:
            case PA_CHANNEL_POSITION_FRONT_RIGHT_OF_CENTER:
            case PA_CHANNEL_POSITION_SIDE_RIGHT:
            case PA_CHANNEL_POSITION_TOP_FRONT_RIGHT:
            case PA_CHANNEL_POSITION_TOP_REAR_RIGHT: sides.push_back(Side::Right); break;
            case PA_CHANNEL_POSITION_LFE: sides.push_back(Side::None); break;
            default: sides.push_back(Side::Middle);
        }
    }
    return sides;
}

MixDown::MixDown(const std::vector<Side>& sides, std::uint32_t channels)
    : inputs_(sides.size()), outputs_(channels), weights_(sides.size() * channels) {
    for (std::uint32_t output = 0; output < outputs_; ++output) {
        const Side side = outputs_ == 1 ? Side::Middle : output == 0 ? Side::Left : Side::Right;
        float* const weights = weights_.data() + output * inputs_;
        float sum = 0;
        for (std::size_t input = 0; input < inputs_; ++input) sum += weights[input] = weightOf(sides[input], side);
        // Nothing on this side: all there is.
        if (sum == 0)
            for (std::size_t input = 0; input < inputs_; ++input) sum += weights[input] = 1;
        for (std::size_t input = 0; input < inputs_; ++input) weights[input] /= sum;
    }
}

void MixDown::mix(std::span<const float> input, std::int64_t frames, std::vector<float>& output) const {
    const auto given = static_cast<std::int64_t>(inputs_ == 0 ? 0 : input.size() / inputs_);
    output.assign(static_cast<std::size_t>(std::max<std::int64_t>(0, frames)) * outputs_, 0.0f);
    if (given == 0) return;
    const auto at = [&](std::int64_t frame, std::uint32_t channel) {
        const float* const sample = input.data() + static_cast<std::size_t>(frame) * inputs_;
        const float* const weights = weights_.data() + channel * inputs_;
        float sum = 0;
        for (std::size_t in = 0; in < inputs_; ++in) sum += sample[in] * weights[in];
        return sum;
    };
    const double step = frames > 1 ? static_cast<double>(given - 1) / static_cast<double>(frames - 1) : 0;
    for (std::int64_t frame = 0; frame < frames; ++frame) {
        float* const out = output.data() + static_cast<std::size_t>(frame) * outputs_;
        if (given == frames) {
            for (std::uint32_t channel = 0; channel < outputs_; ++channel) out[channel] = at(frame, channel);
            continue;
        }
        const double place = step * static_cast<double>(frame);
        const std::int64_t before = std::min(static_cast<std::int64_t>(place), given - 1);
        const std::int64_t after = std::min(before + 1, given - 1);
        const auto part = static_cast<float>(place - static_cast<double>(before));
        for (std::uint32_t channel = 0; channel < outputs_; ++channel)
            out[channel] = at(before, channel) * (1 - part) + at(after, channel) * part;
    }
}

}  // namespace lumacast::sound
