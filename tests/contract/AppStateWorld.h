#pragma once
// Two applications of which one is in front, and what is told of them.

#include <algorithm>
#include <chrono>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "linux/display/X11AppStateMonitor.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/TestWindow.h"
#include "tests/contract/XClientProcess.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast::test {

inline const BundleIdentifier kFirst("org.example.First"), kSecond("org.example.Second"), kTool("org.example.Tool"),
    kUnknown("org.example.Unknown");

/// What was told, and on which lane.
class Updates {
public:
    struct Update {
        std::int64_t state;
        bool frontmost;
        ProcessID pid;
    };
    void add(Update update, bool onMainQueue) {
        const std::lock_guard lock(mutex_);
        updates_.push_back(update);
        alwaysOnMainQueue_ &= onMainQueue;
    }
    bool has(bool frontmost, ProcessID pid, std::optional<std::int64_t> state = {}) const {
        const std::lock_guard lock(mutex_);
        for (const Update& update : updates_)
            if (update.frontmost == frontmost && update.pid == pid && (!state || update.state == *state)) return true;
        return false;
    }
    bool alwaysOnMainQueue() const { return alwaysOnMainQueue_; }
    std::size_t count() const {
        const std::lock_guard lock(mutex_);
        return updates_.size();
    }

private:
    mutable std::mutex mutex_;
    std::vector<Update> updates_;
    bool alwaysOnMainQueue_ = true;
};

class AppStateWorld {
public:
    virtual ~AppStateWorld() = default;
    virtual AppStateMonitor& monitor() = 0;
    /// Two applications with a window each; the first one is in front.
    virtual void openTwoApplications() = 0;
    virtual void bringSecondToFront() = 0;
    virtual ProcessID process(const BundleIdentifier& identifier) = 0;
    virtual void stopAnswering() = 0;
    /// Why all applications are in front here, and stay there; empty where one is.
    virtual std::string whyAllAreInFront() const { return {}; }

    SerialQueue& mainQueue() { return *loop_; }

protected:
    const std::shared_ptr<ThreadLoop> loop_ = std::make_shared<ThreadLoop>();
    ThreadScheduler scheduler_{loop_};
    RunningThreadLoop running_{*loop_};
};

/// The port on a private display, with applications that are processes of their own.
class PortAppStateWorld : public AppStateWorld {
public:
    AppStateMonitor& monitor() override { return monitor_; }
    void openTwoApplications() override {
        second_ = std::make_unique<XClientProcess>(display_.name());
        first_ = std::make_unique<XClientProcess>(display_.name());
        const std::lock_guard lock(naming_->mutex);
        naming_->applications = {{kFirst, {first_->pid()}}, {kSecond, {second_->pid()}}, {kTool, {first_->tool()}}};
    }
    void bringSecondToFront() override {
        TestWindow helper(display_.name(), {.mapped = false});
        const std::uint32_t above = XCB_STACK_MODE_ABOVE;
        xcb_configure_window(helper.connection(), number(second_->window()), XCB_CONFIG_WINDOW_STACK_MODE, &above);
        helper.sync();
    }
    ProcessID process(const BundleIdentifier& identifier) override {
        return identifier == kFirst ? first_->pid() : second_->pid();
    }
    void stopAnswering() override { display_.hang(); }

    PrivateDisplay& display() { return display_; }
    std::unique_ptr<XClientProcess>& first() { return first_; }
    std::unique_ptr<XClientProcess>& second() { return second_; }
    void name(const BundleIdentifier& identifier, std::vector<ProcessID> processes) {
        const std::lock_guard lock(naming_->mutex);
        naming_->applications[identifier] = std::move(processes);
    }

private:
    struct Naming {
        std::mutex mutex;
        std::map<BundleIdentifier, std::vector<ProcessID>> applications;
    };
    const std::shared_ptr<Naming> naming_ = std::make_shared<Naming>();
    PrivateDisplay display_;
    std::unique_ptr<XClientProcess> first_, second_;
    X11AppStateMonitor monitor_{
        display_.name(), scheduler_,
        [naming = naming_](ProcessID pid) -> std::optional<BundleIdentifier> {
            const std::lock_guard lock(naming->mutex);
            for (const auto& [identifier, processes] : naming->applications)
                if (std::find(processes.begin(), processes.end(), pid) != processes.end()) return identifier;
            return std::nullopt;
        },
        [naming = naming_](const BundleIdentifier& identifier) {
            const std::lock_guard lock(naming->mutex);
            const auto found = naming->applications.find(identifier);
            return found == naming->applications.end() ? std::vector<ProcessID>{} : found->second;
        }};
};

/// What the monitor tells from now on.
inline std::shared_ptr<Updates> listenTo(AppStateWorld& world) {
    auto updates = std::make_shared<Updates>();
    SerialQueue& queue = world.mainQueue();
    world.monitor().setHandler([updates, &queue](std::int64_t state, bool frontmost, ProcessID pid) {
        updates->add({state, frontmost, pid}, queue.isCurrent());
    });
    return updates;
}

inline bool becomes(const std::function<bool()>& condition) {
    const auto limit = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (!condition())
        if (std::chrono::steady_clock::now() > limit) return false;
    return true;
}

inline bool isInFront(AppStateMonitor& monitor, const BundleIdentifier& identifier) {
    return (monitor.applicationState(identifier) & AppStateMonitor::kRunningForeground) != 0;
}

/// Known, and not in front.
inline bool isBehind(AppStateMonitor& monitor, const BundleIdentifier& identifier) {
    const std::uint32_t state = monitor.applicationState(identifier);
    return state != 0 && (state & AppStateMonitor::kRunningForeground) == 0;
}

}  // namespace lumacast::test
