#pragma once
#include <cstdint>
#include <functional>
#include <optional>

#include "base/Identifiers.h"

namespace lumacast {

/// What applications are doing. Questions are answered within 100 ms or as "nothing"; callable from the request lane.
class AppStateMonitor {
public:
    /// The bit of an application that runs in the foreground.
    static constexpr std::uint32_t kRunningForeground = 8;
    /// The state value of an update about an application that has ended.
    static constexpr std::int64_t kEnded = 1;

    /// An update about one application: its state value (1: it has ended), whether it is frontmost, its process.
    using Handler = std::function<void(std::int64_t state, bool frontmost, ProcessID pid)>;

    virtual ~AppStateMonitor() = default;
    /// The application's state as a bit set; 0 for an unknown one.
    virtual std::uint32_t applicationState(const BundleIdentifier& identifier) = 0;
    /// The application that the user has in front; none when nothing is, or nobody knows.
    virtual std::optional<BundleIdentifier> frontmostApplication() = 0;
    /// A process of the application, the one in front if it has one there; none when it does not run.
    virtual std::optional<ProcessID> applicationProcess(const BundleIdentifier& identifier) = 0;
    /// Whom to tell of updates, on the main queue; an empty handler for nobody. One handler at a time. What was answered
    /// just before counts as known: only what differs from it is told.
    virtual void setHandler(Handler handler) = 0;
};

}  // namespace lumacast
