#pragma once
#include <functional>
#include <optional>
#include <utility>

#include "platform/AppStateMonitor.h"

namespace lumacast::headless {

/// Every application that runs is in front: nothing covers anything here. Which of them the user has in front nobody
/// knows, as there is no user; and nothing is ever told, as nothing comes to the front or leaves it.
class SyntheticAppStateMonitor final : public AppStateMonitor {
public:
    using ApplicationOf = std::function<std::optional<BundleIdentifier>(ProcessID pid)>;

    explicit SyntheticAppStateMonitor(ApplicationOf applicationOf) : applicationOf_(std::move(applicationOf)) {}

    std::uint32_t applicationState(const BundleIdentifier& identifier) override {
        return applicationProcess(identifier) ? kRunningForeground : 0;
    }
    std::optional<BundleIdentifier> frontmostApplication() override { return std::nullopt; }
    /// Asks this user's processes who they are, for 90 ms at most.
    std::optional<ProcessID> applicationProcess(const BundleIdentifier& identifier) override;
    void setHandler(Handler /*handler*/) override {}

private:
    const ApplicationOf applicationOf_;
};

}  // namespace lumacast::headless
