#pragma once
// The daemon's two sockets, with a snapshot of the test's own behind them.

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <thread>

#include "base/Log.h"
#include "linux/admin/LinuxAdminService.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"
#include "support/ThreadScheduler.h"

namespace lumacast::ctl {

class StandInDaemon final {
public:
    enum class Lane { Runs, Hangs };

    /// Both sockets in `runtimeDirectory`. On a lane that hangs the admin service soon says that the daemon is busy.
    explicit StandInDaemon(const std::string& runtimeDirectory, std::function<Dictionary()> snapshot,
                           Lane lane = Lane::Runs, const std::map<std::string, AdminCommand>& commands = {})
        : ipc_(*reactor_, log_, {.runtimeDirectory = runtimeDirectory}),
          listener_(ipc_.listenerForService("com.orvane.lumacastd")),
          admin_(scheduler_, runtimeDirectory + "/admin.sock", {.snapshot = std::chrono::milliseconds(50)}) {
        listener_->resume();
        for (const auto& [name, command] : commands) admin_.addCommand(name, command);
        admin_.resume(std::move(snapshot));
        if (lane == Lane::Runs) thread_ = std::thread([this] { reactor_->run(); });
    }
    ~StandInDaemon() {
        if (!thread_.joinable()) return;
        reactor_->requestStop();
        thread_.join();
    }
    StandInDaemon(const StandInDaemon&) = delete;
    StandInDaemon& operator=(const StandInDaemon&) = delete;

private:
    const std::shared_ptr<Reactor> reactor_ = std::make_shared<Reactor>();
    ThreadScheduler scheduler_{reactor_};
    Log log_;
    LinuxIpc ipc_;
    const std::shared_ptr<IpcListener> listener_;
    LinuxAdminService admin_;
    std::thread thread_;
};

}  // namespace lumacast::ctl
