#pragma once
// What applications are doing, as an X11 desktop sees it.

#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "linux/display/ActiveWindow.h"
#include "linux/display/QuestionLane.h"
#include "linux/system/HeldProcess.h"
#include "platform/AppStateMonitor.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// An application is in the foreground when one of its processes owns the active window. A tool that has no windows is
/// in the foreground when the active window belongs to one of its ancestors (the terminal it was started from), or when
/// nothing is active.
///
/// While somebody listens, the updates are: another application has come to the front or left it, also where none is in
/// front before or after; another process of the same application is in front now, which nobody has left; and the end of
/// a process that had a window, in front or not.
class X11AppStateMonitor final : public AppStateMonitor, private x11::QuestionLaneObserver {
public:
    /// The other bit that this monitor gives: the application runs, but not in the foreground.
    static constexpr std::uint32_t kRunningBackground = 4;

    /// The application that a process runs; none for one that is no application's. Called on the monitor's own lane.
    using IdentifierOf = std::function<std::optional<BundleIdentifier>(ProcessID)>;
    /// The running processes of an application. Called on the monitor's own lane.
    using ProcessesOf = std::function<std::vector<ProcessID>(const BundleIdentifier&)>;

    /// `display` as in $DISPLAY; without such a server every state is 0. The scheduler is borrowed; tasks that it still
    /// has when the monitor ends do nothing. Without `processesOf` all the user's processes are asked who they are.
    X11AppStateMonitor(std::string display, Scheduler& scheduler, IdentifierOf identifierOf,
                       ProcessesOf processesOf = {});
    ~X11AppStateMonitor() override;

    std::uint32_t applicationState(const BundleIdentifier& identifier) override;
    std::optional<BundleIdentifier> frontmostApplication() override;
    std::optional<ProcessID> applicationProcess(const BundleIdentifier& identifier) override;
    void setHandler(Handler handler) override;

private:
    struct Listener {
        std::mutex mutex;
        Handler handler;
    };

    void connected(x11::X11Connection& connection) override;
    bool takeEvents(x11::X11Connection& connection) override;
    std::vector<int> descriptors() override;
    void readable(int descriptor) override;

    void watch(x11::X11Connection* connection, bool wanted);
    std::optional<ProcessID> frontProcess(x11::X11Connection& connection);
    HeldProcess* remembered(ProcessID pid);
    bool remember(ProcessID pid);
    void rememberOwnersOfWindows(x11::X11Connection& connection);
    bool areOneApplication(ProcessID one, ProcessID other) const;
    void lookForChange(x11::X11Connection& connection);
    std::uint32_t stateOf(x11::X11Connection& connection, const BundleIdentifier& identifier);
    bool isToolInFront(x11::X11Connection& connection, const std::vector<ProcessID>& processes,
                       std::optional<ProcessID> active);
    void tell(std::int64_t state, bool frontmost, ProcessID pid);

    const IdentifierOf identifierOf_;
    const ProcessesOf processesOf_;
    Scheduler& scheduler_;
    const std::shared_ptr<Listener> listener_ = std::make_shared<Listener>();

    static constexpr std::int32_t kNotAsked = 0, kAnsweredNobody = -1;
    std::atomic<std::int32_t> answered_{kNotAsked};  ///< who was said to be in front last, since the watch began

    // Of the lane alone.
    std::unique_ptr<x11::ActiveWindow> activeWindow_;
    bool watching_ = false;
    std::optional<ProcessID> front_;
    std::vector<HeldProcess> seen_;  ///< those with windows that have not ended

    std::unique_ptr<x11::QuestionLane> lane_;  // last: its thread uses what stands above
};

}  // namespace lumacast
