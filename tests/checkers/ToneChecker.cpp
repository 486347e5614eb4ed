#include "tests/checkers/ToneChecker.h"

#include <algorithm>
#include <cmath>
#include <complex>
#include <cstdio>
#include <numbers>

namespace lumacast::checkers {
namespace {

using std::chrono::nanoseconds;

constexpr double kSilence = -200;
constexpr double kWindowSeconds = 0.1;
constexpr double kShortestBeep = 0.02;
constexpr double kShortestPause = 0.02;

double decibels(double amplitude) {
    return amplitude > 1e-10 ? 20 * std::log10(amplitude) : kSilence;
}

nanoseconds secondsToTime(double seconds) {
    return nanoseconds(std::llround(seconds * 1e9));
}
double timeToSeconds(nanoseconds time) {
    return static_cast<double>(time.count()) / 1e9;
}

std::string inWords(double frequency, double level, double at) {
    char text[120];
    std::snprintf(text, sizeof text, "the tone of %g Hz is at %.1f dB in the window at %.3f s", frequency, level, at);
    return text;
}

// Calls `judge(level, time)` for each window; the last one ends with the stretch.
template <typename Judge>
Findings eachWindow(const Sound& sound, double frequency, const Stretch& stretch, const Judge& judge) {
    const auto place = [&](nanoseconds time) { return std::llround(timeToSeconds(time) * sound.rate); };
    const auto length = std::llround(kWindowSeconds * sound.rate);
    const auto from = place(stretch.from), to = place(stretch.to);
    // A rounding of one sample is no hole.
    if (from < 0 || to > static_cast<long long>(sound.samples.size()) + 1 || to - from < length)
        return {"the sound doesn't cover the stretch from " + std::to_string(timeToSeconds(stretch.from)) + " s to " +
                std::to_string(timeToSeconds(stretch.to)) + " s"};
    const auto end = std::min<long long>(to, static_cast<long long>(sound.samples.size()));
    Findings findings;
    for (auto start = from;; start = std::min(start + length, end - length)) {
        const auto window =
            std::span(sound.samples).subspan(static_cast<std::size_t>(start), static_cast<std::size_t>(length));
        const double level = toneLevel(window, sound.rate, frequency);
        if (!judge(level)) findings.push_back(inWords(frequency, level, static_cast<double>(start) / sound.rate));
        if (start >= end - length) break;
    }
    return findings;
}

// The amplitude of the tone around each hop; windows hold a whole number of its periods.
struct Envelope {
    double hop = 0;     // seconds from one value to the next
    double centre = 0;  // time of the first value
    std::vector<double> values;
};

Envelope envelopeOf(const Sound& sound, double frequency) {
    const double periods = std::max(1.0, std::round(0.01 * frequency));
    const auto length = static_cast<std::size_t>(std::llround(periods / frequency * sound.rate));
    const std::size_t hop = std::max<std::size_t>(1, static_cast<std::size_t>(sound.rate) / 4000);
    // Silence before and after, so that a beep at the very beginning has an edge too.
    std::vector<std::complex<double>> sums(sound.samples.size() + 2 * length + 1);
    for (std::size_t place = 1; place < sums.size(); ++place) {
        const bool inside = place > length && place - 1 - length < sound.samples.size();
        const double value = inside ? sound.samples[place - 1 - length] : 0.0;
        const double angle = -2 * std::numbers::pi * frequency * static_cast<double>(place) / sound.rate;
        sums[place] = sums[place - 1] + value * std::polar(1.0, angle);
    }
    const double rate = sound.rate, size = static_cast<double>(length);
    Envelope envelope{static_cast<double>(hop) / rate, -size / 2 / rate, {}};
    for (std::size_t place = 0; place + length < sums.size(); place += hop)
        envelope.values.push_back(2 / size * std::abs(sums[place + length] - sums[place]));
    return envelope;
}

}  // namespace

double toneLevel(std::span<const float> samples, int rate, double frequency) {
    if (samples.empty()) return kSilence;
    const double turn = 2 * std::numbers::pi * frequency / rate;
    const double factor = 2 * std::cos(turn);
    double one = 0, two = 0, weight = 0;
    for (std::size_t place = 0; place < samples.size(); ++place) {
        const double hann = 0.5 - 0.5 * std::cos(2 * std::numbers::pi * (static_cast<double>(place) + 0.5) /
                                                 static_cast<double>(samples.size()));
        const double next = samples[place] * hann + factor * one - two;
        two = one;
        one = next;
        weight += hann;
    }
    const double power = one * one + two * two - factor * one * two;
    return decibels(2 * std::sqrt(std::max(0.0, power)) / weight);
}

Findings checkTonePresent(const Sound& sound, double frequency, double leastLevel, const Stretch& stretch) {
    return eachWindow(sound, frequency, stretch, [leastLevel](double level) { return level >= leastLevel; });
}

Findings checkToneAbsent(const Sound& sound, double frequency, double mostLevel, const Stretch& stretch) {
    return eachWindow(sound, frequency, stretch, [mostLevel](double level) { return level <= mostLevel; });
}

Stretch wholeOf(const Sound& sound) {
    return {nanoseconds::zero(), sound.rate == 0
                                     ? nanoseconds::zero()
                                     : secondsToTime(static_cast<double>(sound.samples.size()) / sound.rate)};
}

std::vector<nanoseconds> beepOnsets(const Sound& sound, double frequency, double leastLevel) {
    std::vector<nanoseconds> onsets;
    if (sound.samples.empty() || sound.rate == 0) return onsets;
    const Envelope envelope = envelopeOf(sound, frequency);
    const auto& values = envelope.values;
    const double floor = std::pow(10, leastLevel / 20);
    const auto hops = [&](double seconds) { return static_cast<std::size_t>(seconds / envelope.hop); };
    for (std::size_t place = 0; place < values.size(); ++place) {
        if (values[place] < floor) continue;
        // The height of this beep: its loudest before it has been below half of that for the length of a pause.
        double height = values[place];
        std::size_t end = place, above = place, lasting = 0;
        for (; end < values.size() && end - above < hops(kShortestPause); ++end) {
            height = std::max(height, values[end]);
            if (values[end] >= height / 2) {
                above = end;
                ++lasting;
            }
        }
        if (lasting >= hops(kShortestBeep)) {
            std::size_t crossing = place;
            while (values[crossing] < height / 2) ++crossing;
            double part = 1;
            if (crossing > 0 && values[crossing] > values[crossing - 1])
                part = (height / 2 - values[crossing - 1]) / (values[crossing] - values[crossing - 1]);
            const double at = envelope.centre + envelope.hop * (static_cast<double>(crossing) - 1 + part);
            onsets.push_back(secondsToTime(std::max(0.0, at)));
        }
        place = end;
    }
    return onsets;
}

Findings checkBeeps(const std::vector<nanoseconds>& onsets, const std::vector<nanoseconds>& expected,
                    nanoseconds tolerance) {
    Findings findings;
    std::vector<nanoseconds> left = onsets;
    for (const nanoseconds time : expected) {
        const auto nearest = std::min_element(left.begin(), left.end(), [time](nanoseconds a, nanoseconds b) {
            return std::chrono::abs(a - time) < std::chrono::abs(b - time);
        });
        if (nearest == left.end() || std::chrono::abs(*nearest - time) > tolerance)
            findings.push_back("no beep at " + std::to_string(timeToSeconds(time)) + " s");
        else
            left.erase(nearest);
    }
    for (const nanoseconds time : left)
        findings.push_back("a beep too many at " + std::to_string(timeToSeconds(time)) + " s");
    return findings;
}

}  // namespace lumacast::checkers
