#pragma once
// One application in the simulation: a process that talks to the daemon and remembers what it was told.

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Identifiers.h"
#include "base/MessageTables.h"
#include "tests/fakes/FakePlatform.h"

namespace lumacast {

/// A client process with one window. Everything it is told arrives on its own main queue; the counters are read between
/// steps.
class SimulatedApplication {
public:
    /// One request that has a reply: how often it was answered and with what.
    struct Asked {
        DaemonMessage message;
        int answers = 0;
        int failures = 0;  ///< the connection said that there will be no answer
        Array values;
        std::size_t firstOfProcess = 0;  ///< the first request of the process that asked
    };
    /// A message from the daemon.
    struct Told {
        ClientMessage message;
        Array arguments;
        std::size_t firstOfProcess = 0;  ///< the first request of the process that was told
    };

    /// Installs the application under `identifier`, starts its process and shows its window.
    SimulatedApplication(FakePlatform& machine, BundleIdentifier identifier, const std::string& name, ProcessID pid,
                         ContextID window);
    ~SimulatedApplication();

    void connect();
    bool isConnected() const { return connection_ != nullptr; }
    /// Its end of the connection, for whoever wants to misuse it; null when there is none.
    const std::shared_ptr<IpcConnection>& connection() const { return connection_; }
    /// The process dies: connection, window and process are gone.
    void die();
    bool isAlive() const { return process_ != nullptr; }
    ProcessID pid() const { return pid_; }
    /// A new process of the same application, with another number and the same window.
    void startAgain(ProcessID pid);
    /// The same while its process still ends: the new one has connected when the older one is gone.
    void replaceProcess(ProcessID pid);

    std::shared_ptr<Asked> ask(DaemonMessage message, Array arguments = {});
    void tell(DaemonMessage message, Array arguments = {});

    /// What a start asks for beside its windows.
    struct Wishes {
        double width = 640;
        bool microphone = false, camera = false, broadcast = false, system = false, capture = false;
    };
    std::shared_ptr<Asked> start(const std::vector<ContextID>& windows, const Wishes& wishes);
    std::shared_ptr<Asked> start() { return start({window}, {}); }

    const BundleIdentifier identifier;
    const std::string name;
    const ContextID window;

    const std::vector<std::shared_ptr<Asked>>& asked() const { return asked_; }
    /// The first of them that was asked over the connection there is now.
    std::size_t firstOfConnection() const { return firstOfConnection_; }
    const std::vector<Told>& told() const { return *told_; }
    int losses() const { return *losses_; }

private:
    class Inbox;

    FakePlatform& machine_;
    ProcessID pid_;
    std::unique_ptr<FakeIpc> process_;
    std::shared_ptr<IpcConnection> connection_;
    std::shared_ptr<Inbox> inbox_;
    std::vector<std::shared_ptr<Asked>> asked_;
    std::size_t firstOfConnection_ = 0, firstOfProcess_ = 0;
    std::shared_ptr<std::vector<Told>> told_ = std::make_shared<std::vector<Told>>();
    std::shared_ptr<int> losses_ = std::make_shared<int>(0);
};

}  // namespace lumacast
