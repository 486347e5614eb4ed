#pragma once
#include <functional>
#include <optional>
#include <utility>

#include "platform/AppStateMonitor.h"

namespace lumacast::headless {

/// Every application that is known is in front: nothing covers anything here. Whether it runs is not asked, as looking
/// at all processes may take longer than an answer has, and whoever records does run. Which of them the user has in
/// front nobody knows, as there is no user; and nothing is ever told, as nothing comes to the front or leaves it.
class SyntheticAppStateMonitor final : public AppStateMonitor {
public:
    using IsKnown = std::function<bool(const BundleIdentifier& identifier)>;
    using ApplicationOf = std::function<std::optional<BundleIdentifier>(ProcessID pid)>;

    SyntheticAppStateMonitor(IsKnown isKnown, ApplicationOf applicationOf)
        : isKnown_(std::move(isKnown)), applicationOf_(std::move(applicationOf)) {}

    std::uint32_t applicationState(const BundleIdentifier& identifier) override {
        return isKnown_(identifier) ? kRunningForeground : 0;
    }
    std::optional<BundleIdentifier> frontmostApplication() override { return std::nullopt; }
    /// Asks this user's processes who they are, the newest first, for 90 ms at most.
    std::optional<ProcessID> applicationProcess(const BundleIdentifier& identifier) override;
    void setHandler(Handler /*handler*/) override {}

private:
    const IsKnown isKnown_;
    const ApplicationOf applicationOf_;
};

}  // namespace lumacast::headless
