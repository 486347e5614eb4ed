#include "headless/display/SyntheticAppStateMonitor.h"

#include <algorithm>
#include <chrono>

#include "linux/system/UserProcesses.h"

namespace lumacast::headless {

namespace {

constexpr std::chrono::milliseconds kPatience{90};

}  // namespace

std::optional<ProcessID> SyntheticAppStateMonitor::applicationProcess(const BundleIdentifier& identifier) {
    const auto end = std::chrono::steady_clock::now() + kPatience;
    auto processes = processesOfThisUser();
    std::sort(processes.begin(), processes.end(),
              [](ProcessID one, ProcessID other) { return number(one) > number(other); });
    for (const ProcessID pid : processes) {
        if (std::chrono::steady_clock::now() > end) break;
        if (applicationOf_(pid) == identifier) return pid;
    }
    return std::nullopt;
}

}  // namespace lumacast::headless
