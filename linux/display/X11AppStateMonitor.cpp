#include "linux/display/X11AppStateMonitor.h"

#include <algorithm>
#include <utility>

#include "linux/display/WindowOwner.h"
#include "linux/system/Ancestors.h"
#include "linux/system/UserProcesses.h"

namespace lumacast {
namespace {

using x11::X11Connection;

// Processes whose end is waited for, at most.
constexpr std::size_t kMostSeen = 256;

bool contains(const std::vector<ProcessID>& processes, ProcessID pid) {
    return std::find(processes.begin(), processes.end(), pid) != processes.end();
}

X11AppStateMonitor::ProcessesOf askingAll(const X11AppStateMonitor::IdentifierOf& identifierOf) {
    return [identifierOf](const BundleIdentifier& identifier) {
        std::vector<ProcessID> found = processesOfThisUser();
        std::erase_if(found, [&](ProcessID process) { return identifierOf(process) != identifier; });
        return found;
    };
}

}  // namespace

X11AppStateMonitor::X11AppStateMonitor(std::string display, Scheduler& scheduler, IdentifierOf identifierOf,
                                       ProcessesOf processesOf)
    : identifierOf_(std::move(identifierOf)),
      processesOf_(processesOf ? std::move(processesOf) : askingAll(identifierOf_)),
      scheduler_(scheduler),
      lane_(std::make_unique<x11::QuestionLane>(std::move(display), "lc-appstate",
                                                static_cast<x11::QuestionLaneObserver*>(this))) {}

X11AppStateMonitor::~X11AppStateMonitor() {
    lane_.reset();
    const std::lock_guard lock(listener_->mutex);
    listener_->handler = nullptr;
}

std::uint32_t X11AppStateMonitor::applicationState(const BundleIdentifier& identifier) {
    const std::function<std::uint32_t(X11Connection&)> question = [this, identifier](X11Connection& connection) {
        return stateOf(connection, identifier);
    };
    return lane_->ask<std::uint32_t>(question, 0);
}

std::optional<BundleIdentifier> X11AppStateMonitor::frontmostApplication() {
    using Answer = std::optional<BundleIdentifier>;
    const std::function<Answer(X11Connection&)> question = [this](X11Connection& connection) {
        const auto active = frontProcess(connection);
        return active ? identifierOf_(*active) : std::nullopt;
    };
    const Answer answer = lane_->ask<Answer>(question, std::nullopt);
    answered_ = kAnsweredNobody;
    return answer;
}

std::optional<ProcessID> X11AppStateMonitor::applicationProcess(const BundleIdentifier& identifier) {
    using Answer = std::optional<ProcessID>;
    const std::function<Answer(X11Connection&)> question = [this, identifier](X11Connection& connection) -> Answer {
        const auto active = frontProcess(connection);
        if (active && identifierOf_(*active) == identifier) return active;
        const auto processes = processesOf_(identifier);
        return processes.empty() ? std::nullopt : std::optional(processes.front());
    };
    const Answer answer = lane_->ask<Answer>(question, std::nullopt);
    answered_ = answer ? number(*answer) : kAnsweredNobody;
    return answer;
}

std::uint32_t X11AppStateMonitor::stateOf(X11Connection& connection, const BundleIdentifier& identifier) {
    // The active window alone answers most questions, and looking at every process may take longer than an answer has.
    const auto active = frontProcess(connection);
    if (active && identifierOf_(*active) == identifier) return kRunningForeground;
    const auto processes = processesOf_(identifier);
    if (processes.empty()) return 0;
    if (active && contains(processes, *active)) return kRunningForeground;
    return isToolInFront(connection, processes, active) ? kRunningForeground : kRunningBackground;
}

bool X11AppStateMonitor::isToolInFront(X11Connection& connection, const std::vector<ProcessID>& processes,
                                       std::optional<ProcessID> active) {
    for (const ProcessID owner : x11::ownersOf(connection, activeWindow_->applicationWindows()))
        if (contains(processes, owner)) return false;
    if (!active) return true;
    return std::any_of(processes.begin(), processes.end(),
                       [&](ProcessID process) { return descendsFrom(process, *active); });
}

void X11AppStateMonitor::setHandler(Handler handler) {
    const bool wanted = handler != nullptr;
    {
        const std::lock_guard lock(listener_->mutex);
        listener_->handler.swap(handler);
    }
    lane_->later([this, wanted](X11Connection* connection) { watch(connection, wanted); });
}

// On the lane from here on

void X11AppStateMonitor::connected(X11Connection& connection) {
    activeWindow_ = std::make_unique<x11::ActiveWindow>(connection);
    if (!watching_) return;
    activeWindow_->watch(true);
    lookForChange(connection);
}

// Without a server the next connection takes note. Only changes are told: not who is in front at first, unless it is
// another one than was answered last.
void X11AppStateMonitor::watch(X11Connection* connection, bool wanted) {
    if (wanted == watching_) return;
    watching_ = wanted;
    seen_.clear();
    front_.reset();
    if (connection == nullptr) return;
    activeWindow_->watch(wanted);
    if (!wanted) return;
    rememberOwnersOfWindows(*connection);
    front_ = frontProcess(*connection);
    if (front_ && !remember(*front_)) front_.reset();
    const std::int32_t answered = answered_.exchange(kNotAsked);
    if (front_ && answered != kNotAsked && answered != number(*front_)) tell(kRunningForeground, true, *front_);
}

std::optional<ProcessID> X11AppStateMonitor::frontProcess(X11Connection& connection) {
    const xcb_window_t window = activeWindow_->current();
    return window == XCB_NONE ? std::nullopt : x11::ownerOf(connection, window);
}

HeldProcess* X11AppStateMonitor::remembered(ProcessID pid) {
    const auto found =
        std::find_if(seen_.begin(), seen_.end(), [&](const auto& process) { return process.pid() == pid; });
    return found == seen_.end() ? nullptr : &*found;
}

/// False for one that has ended.
bool X11AppStateMonitor::remember(ProcessID pid) {
    if (const HeldProcess* const known = remembered(pid)) return !known->hasEnded();
    auto process = HeldProcess::hold(pid);
    if (!process) return false;
    if (seen_.size() >= kMostSeen) {
        // The one that has been there for the longest time, but never the one in front.
        const auto oldest =
            std::find_if(seen_.begin(), seen_.end(), [&](const auto& each) { return each.pid() != front_; });
        seen_.erase(oldest);
    }
    seen_.push_back(std::move(*process));
    return true;
}

void X11AppStateMonitor::rememberOwnersOfWindows(X11Connection& connection) {
    for (const ProcessID owner : x11::ownersOf(connection, activeWindow_->applicationWindows())) remember(owner);
}

bool X11AppStateMonitor::takeEvents(X11Connection& connection) {
    using Change = x11::ActiveWindow::Change;
    Change change = Change::None;
    bool areThere = false;
    while (const x11::Owned<xcb_generic_event_t> event{xcb_poll_for_event(connection.get())}) {
        change = std::max(change, activeWindow_->meaningOf(*event));
        areThere = true;
    }
    if (change == Change::None || !watching_) return areThere;
    if (change == Change::Windows) rememberOwnersOfWindows(connection);
    lookForChange(connection);
    return true;
}

bool X11AppStateMonitor::areOneApplication(ProcessID one, ProcessID other) const {
    const auto identifier = identifierOf_(one);
    return identifier && identifier == identifierOf_(other);
}

void X11AppStateMonitor::lookForChange(X11Connection& connection) {
    auto now = frontProcess(connection);
    // The server may still have the window of a process that has ended.
    if (now && !remember(*now)) now.reset();
    if (now == front_) return;
    const auto before = std::exchange(front_, now);
    // One that has ended is told of when its end is seen.
    const HeldProcess* const left = before ? remembered(*before) : nullptr;
    if (left != nullptr && !left->hasEnded() && !(now && areOneApplication(*before, *now)))
        tell(kRunningBackground, false, *before);
    if (now) tell(kRunningForeground, true, *now);
}

std::vector<int> X11AppStateMonitor::descriptors() {
    std::vector<int> all;
    for (const HeldProcess& process : seen_) all.push_back(process.descriptor());
    return all;
}

void X11AppStateMonitor::readable(int descriptor) {
    const auto ended = std::find_if(seen_.begin(), seen_.end(),
                                    [&](const auto& process) { return process.descriptor() == descriptor; });
    if (ended == seen_.end()) return;
    const ProcessID pid = ended->pid();
    seen_.erase(ended);
    if (front_ == pid) front_.reset();
    tell(kEnded, false, pid);
}

void X11AppStateMonitor::tell(std::int64_t state, bool frontmost, ProcessID pid) {
    scheduler_.mainQueue().async([listener = listener_, state, frontmost, pid] {
        Handler handler;
        {
            const std::lock_guard lock(listener->mutex);
            handler = listener->handler;
        }
        if (handler) handler(state, frontmost, pid);
    });
}

}  // namespace lumacast
