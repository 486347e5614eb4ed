#pragma once
// Three ends in one process, each with a reactor on a thread of its own, talking over real sockets.

#include <unistd.h>

#include <array>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <thread>
#include <utility>

#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"
#include "tests/contract/IpcWorld.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast {

/// One end: a reactor on its own thread, a log and an Ipc.
class IpcPort {
public:
    explicit IpcPort(const std::string& runtimeDirectory, LinuxIpcOptions options = {}) {
        options.runtimeDirectory = runtimeDirectory;
        options.entitlements = [this](ProcessID, std::string_view name) { return lookUp(name); };
        ipc = std::make_unique<LinuxIpc>(reactor, log, std::move(options));
        thread_ = std::thread([this] { reactor.run(); });
    }
    IpcPort(const IpcPort&) = delete;
    IpcPort& operator=(const IpcPort&) = delete;
    ~IpcPort() { stop(); }

    /// Ends the reactor; nothing is delivered any more.
    void stop() {
        if (!thread_.joinable()) return;
        reactor.requestStop();
        thread_.join();
    }

    Shared<std::map<std::string, Value>> grants;
    Shared<int> entitlementQuestions;
    Log log;
    Reactor reactor;
    std::unique_ptr<LinuxIpc> ipc;

private:
    std::optional<Value> lookUp(std::string_view name) {
        entitlementQuestions.change([](int& n) { ++n; });
        const auto all = grants.get();
        const auto found = all.find(std::string(name));
        return found == all.end() ? std::nullopt : std::optional(found->second);
    }
    std::thread thread_;
};

class IpcPortWorld final : public IpcWorld {
public:
    Ipc& ipc(Side side) override { return *port(side).ipc; }
    void on(Side side, const Task& task) override { port(side).reactor.sync(task); }
    bool isOnMainQueue(Side side) override { return port(side).reactor.isCurrent(); }
    void settle() override {
        // What was sent is readable at once; each turn of a loop reads every socket that is readable.
        for (int i = 0; i < 8; ++i)
            for (IpcPort& port : ports_) port.reactor.sync([] {});
    }
    ProcessID pid(Side) override { return ProcessID{getpid()}; }
    void grant(Side side, const std::string& name, Value value) override {
        port(side).grants.change([&](auto& all) { all.insert_or_assign(name, std::move(value)); });
    }
    IpcPort& port(Side side) { return ports_[static_cast<std::size_t>(side)]; }
    const std::string& directory() const { return directory_.path(); }

private:
    ScratchDirectory directory_;
    std::array<IpcPort, 3> ports_{IpcPort(directory_.path()), IpcPort(directory_.path()), IpcPort(directory_.path())};
};

}  // namespace lumacast
