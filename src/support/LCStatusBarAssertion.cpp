#include "support/LCStatusBarAssertion.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cmath>
#include <cstdio>

namespace lumacast {

namespace {

constexpr std::chrono::milliseconds kTimerPeriod{500};
constexpr double kPaddedBelow = 60.0;  // seconds
constexpr double kLongest = 1e15;      // seconds; beyond it a double has no whole ones

}  // namespace

void LCStatusBarAssertion::startRepeatingTimer() {
    SerialQueue& main = platform_.scheduler.mainQueue();
    main.async([weak = weak_from_this(), &main] {
        const auto self = weak.lock();
        if (!self) return;
        self->timerStartDate_ = self->platform_.clock.now();
        self->timer_ = nullptr;
        // The main queue lives as long as the scheduler does.
        self->timer_ = self->platform_.scheduler.timer(std::shared_ptr<SerialQueue>(std::shared_ptr<void>(), &main),
                                                       kTimerPeriod, [weak] {
                                                           if (const auto live = weak.lock())
                                                               live->updateStatusStringWithTimer();
                                                       });
    });
}

std::string LCStatusBarAssertion::stringWithTimeInterval(double seconds) {
    const double clamped = std::isfinite(seconds) ? std::clamp(seconds, 0.0, kLongest) : 0.0;
    const auto whole = static_cast<long long>(clamped);
    char text[64];
    if (clamped < kPaddedBelow) {
        std::snprintf(text, sizeof text, "%02lld:%02lld", whole / 60, whole % 60);
        return text;
    }
    const std::array units{whole / 86'400, whole / 3'600 % 24, whole / 60 % 60, whole % 60};
    const auto first = static_cast<std::size_t>(
        std::find_if(units.begin(), units.end(), [](long long unit) { return unit != 0; }) - units.begin());
    // From a minute on there always is a second unit.
    std::snprintf(text, sizeof text, "%lld:%02lld", units[first], units[first + 1]);
    return text;
}

std::string LCStatusBarAssertion::lcLocalizedRecordingDuration(double, bool isPaused) {
    const auto text = [&](std::string_view key) {
        return localization_._lcLocalizedStringFromFrameworkBundleWithKey(key).value_or("");
    };
    if (!broadcasting) return text(isPaused ? "RECORDING_PAUSED_STATUS_BAR" : "RECORDING_STATUS_BAR");
    return Localization::filledIn(
        text(isPaused ? "BROADCASTING_PAUSED_STATUS_BAR_FORMAT" : "BROADCASTING_STATUS_BAR_FORMAT"),
        broadcastServiceName);
}

}  // namespace lumacast
