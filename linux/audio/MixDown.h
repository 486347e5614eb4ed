#pragma once
// From a stream's channels to those of the tap.

#include <cstdint>
#include <span>
#include <vector>

namespace lumacast::sound {

/// Where a channel is heard.
enum class Side : std::uint8_t { Left, Right, Middle, None };

/// Where channels at these positions (in the servers' numbering) are heard.
std::vector<Side> sidesOf(const std::vector<std::int32_t>& positions);

/// Mixes a stream's channels down to one or two: to one, the average of all that are heard somewhere; to two, each side
/// the average of its own and, weighted less, of the middle. Never louder than the loudest channel. A value.
class MixDown final {
public:
    /// `channels` is 1 or 2.
    MixDown(const std::vector<Side>& sides, std::uint32_t channels);

    /// `input` holds whole frames of the stream; `output` becomes `frames` frames of the tap, stretched or shrunk to
    /// them where that differs.
    void mix(std::span<const float> input, std::int64_t frames, std::vector<float>& output) const;

private:
    const std::size_t inputs_;
    const std::uint32_t outputs_;
    std::vector<float> weights_;  ///< outputs x inputs
};

}  // namespace lumacast::sound
