#pragma once
#include <array>
#include <bit>
#include <cstdint>

namespace lumacast {

/// The simulation's random numbers: xoshiro256** seeded by splitmix64 (Blackman and Vigna, public domain). Written out
/// here because the standard library's distributions differ between implementations, and a seed must replay everywhere.
class SimRandom {
public:
    explicit SimRandom(std::uint64_t seed) {
        for (std::uint64_t& word : state_) word = splitmix(seed);
    }

    std::uint64_t next() {
        const std::uint64_t result = std::rotl(state_[1] * 5, 7) * 9;
        const std::uint64_t shifted = state_[1] << 17;
        state_[2] ^= state_[0];
        state_[3] ^= state_[1];
        state_[1] ^= state_[2];
        state_[0] ^= state_[3];
        state_[2] ^= shifted;
        state_[3] = std::rotl(state_[3], 45);
        return result;
    }

    /// A number from 0 to `bound` - 1; `bound` is at least 1. The modulo's bias is far below what a test could notice.
    std::uint64_t below(std::uint64_t bound) { return next() % bound; }

    /// True with the probability `numerator` / `denominator`.
    bool chance(std::uint64_t numerator, std::uint64_t denominator) { return below(denominator) < numerator; }

    /// One step of splitmix64: advances `state` and answers a well-mixed number.
    static std::uint64_t splitmix(std::uint64_t& state) {
        state += 0x9E3779B97F4A7C15u;
        std::uint64_t mixed = state;
        mixed = (mixed ^ (mixed >> 30)) * 0xBF58476D1CE4E5B9u;
        mixed = (mixed ^ (mixed >> 27)) * 0x94D049BB133111EBu;
        return mixed ^ (mixed >> 31);
    }

private:
    std::array<std::uint64_t, 4> state_;
};

}  // namespace lumacast
