#pragma once
#include <map>
#include <mutex>

#include "platform/RenderServer.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// Window layers and their owners as the test sets them. A failing call ("RenderServer.clientPort") finds nothing, like
/// a server that does not answer in time. Thread-safe; outlives the ports it gave out.
class FakeRenderServer final : public RenderServer {
public:
    explicit FakeRenderServer(FaultPlan& faults) : faults_(faults) {}

    std::unique_ptr<ClientPort> clientPort(ContextID context) override;

    /// The layer belongs to this process from now on.
    void addLayer(ContextID context, ProcessID owner);
    void removeLayer(ContextID context);
    /// The process has ended: its layers are gone, and ports to it answer none.
    void processEnded(ProcessID owner);
    /// Ports that were given out and not released yet.
    int portsOpen() const;

private:
    class Port;

    FaultPlan& faults_;
    mutable std::mutex mutex_;
    std::map<ContextID, ProcessID> layers_;
    std::map<ProcessID, int> ended_;
    int portsOpen_ = 0;
};

}  // namespace lumacast
