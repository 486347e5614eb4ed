#pragma once
// Connections in memory: a machine with processes that talk to each other.

#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "base/Log.h"
#include "platform/IpcListener.h"
#include "platform/Scheduler.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

class FakeIpcConnection;
struct FakeListenerState;

/// The machine that the processes of a test share: its services, and who is alive. Outlives its processes.
struct FakeIpcMachine {
    std::mutex mutex;
    std::map<std::string, std::weak_ptr<FakeListenerState>> services;
    std::size_t acceptedConnections = 0;
    /// How often a process has answered a request that it had answered already: the second answer goes nowhere.
    std::map<ProcessID, int> secondAnswers;
};

/// The Ipc role of one process: listeners and connections whose messages are encoded, checked and decoded like on the
/// real wire, with the limits of the table. Everything is delivered on the process's main queue. A failing call
/// ("Ipc.send") is a message that could not be delivered. Several of them on one machine are several processes, each
/// with a main queue of its own. Thread-safe.
class FakeIpc final : public Ipc {
public:
    /// `mainQueue` is this process's; `log` takes the lines about what was dropped.
    FakeIpc(std::shared_ptr<FakeIpcMachine> machine, std::shared_ptr<SerialQueue> mainQueue, ProcessID pid,
            FaultPlan& faults, Log& log);
    ~FakeIpc() override;

    std::shared_ptr<IpcListener> listenerForService(const std::string& name) override;
    std::shared_ptr<IpcListener> anonymousListener() override;
    std::shared_ptr<IpcConnection> connectToService(const std::string& name) override;
    std::shared_ptr<IpcConnection> connectToEndpoint(const std::shared_ptr<IpcEndpoint>& endpoint) override;

    /// What this process is told when it asks for the entitlement of a peer with this number.
    void grant(ProcessID peer, const std::string& name, Value value);
    /// Whose process that peer is, as this process is told; kUser at first.
    void setUser(ProcessID peer, UserID user);
    static constexpr UserID kUser{1000};
    /// The process dies: its listeners close, its connections break as its peers see it, and it is told nothing any
    /// more.
    void kill();
    /// While false, the process reads nothing: what is sent to it waits, up to the limit.
    void setReading(bool reading);

    ProcessID pid() const;

    /// What all ends in this process share.
    struct Process;

private:
    std::shared_ptr<IpcConnection> connectTo(const std::shared_ptr<FakeListenerState>& listener);

    const std::shared_ptr<Process> process_;
};

}  // namespace lumacast
