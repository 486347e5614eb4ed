#include "headless/display/SyntheticAppStateMonitor.h"

#include <chrono>

#include "linux/display/Processes.h"

namespace lumacast::headless {

namespace {

constexpr std::chrono::milliseconds kPatience{90};

}  // namespace

std::optional<ProcessID> SyntheticAppStateMonitor::applicationProcess(const BundleIdentifier& identifier) {
    const auto end = std::chrono::steady_clock::now() + kPatience;
    for (const ProcessID pid : x11::processesOfThisUser()) {
        if (std::chrono::steady_clock::now() > end) break;
        if (applicationOf_(pid) == identifier) return pid;
    }
    return std::nullopt;
}

}  // namespace lumacast::headless
