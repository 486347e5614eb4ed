#pragma once

#include <chrono>
#include <span>
#include <vector>

#include "tests/checkers/Finding.h"
#include "tests/checkers/Sound.h"

namespace lumacast::checkers {

/// Decibels below full scale of a sine of this frequency (0 is a sine of amplitude 1), by the Goertzel recurrence under
/// a Hann window. -200 for silence or no samples. Neighbours further away than 4 / length are suppressed by 60 dB and
/// more.
[[nodiscard]] double toneLevel(std::span<const float> samples, int rate, double frequency);

/// A stretch of movie time.
struct Stretch {
    std::chrono::nanoseconds from{};
    std::chrono::nanoseconds to{};
};

/// Finds every window of 100 ms in the stretch (its whole length is looked at, the last window ends with it) in which
/// the tone is weaker than `leastLevel` dB. A stretch that reaches beyond the sound is a finding.
[[nodiscard]] Findings checkTonePresent(const Sound& sound, double frequency, double leastLevel,
                                        const Stretch& stretch);

/// Finds every window of 100 ms in which the tone is stronger than `mostLevel` dB.
[[nodiscard]] Findings checkToneAbsent(const Sound& sound, double frequency, double mostLevel, const Stretch& stretch);

/// The whole sound.
[[nodiscard]] Stretch wholeOf(const Sound& sound);

/// When each beep of this frequency begins: where its envelope passes half of its own height. A beep lasts 20 ms or
/// more, is louder than `leastLevel` dB and separated from the next by 20 ms of less than half its height. Good to
/// about 1 ms.
[[nodiscard]] std::vector<std::chrono::nanoseconds> beepOnsets(const Sound& sound, double frequency,
                                                               double leastLevel = -40);

/// Finds beeps that are missing, too many, or further than `tolerance` from their time.
[[nodiscard]] Findings checkBeeps(const std::vector<std::chrono::nanoseconds>& onsets,
                                  const std::vector<std::chrono::nanoseconds>& expected,
                                  std::chrono::nanoseconds tolerance);

}  // namespace lumacast::checkers
