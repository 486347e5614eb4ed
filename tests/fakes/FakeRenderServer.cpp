#include "tests/fakes/FakeRenderServer.h"

namespace lumacast {

class FakeRenderServer::Port final : public ClientPort {
public:
    Port(FakeRenderServer& server, ProcessID owner, int generation)
        : server_(server), owner_(owner), generation_(generation) {}
    ~Port() override {
        const std::lock_guard lock(server_.mutex_);
        --server_.portsOpen_;
    }
    std::optional<ProcessID> processIdentifier() override {
        const std::lock_guard lock(server_.mutex_);
        if (server_.ended_[owner_] != generation_) return std::nullopt;
        return owner_;
    }

private:
    FakeRenderServer& server_;
    const ProcessID owner_;
    const int generation_;  ///< how often a process of this number had ended when the port was made
};

std::unique_ptr<ClientPort> FakeRenderServer::clientPort(ContextID context) {
    if (faults_.fails("RenderServer.clientPort")) return nullptr;
    const std::lock_guard lock(mutex_);
    const auto layer = layers_.find(context);
    if (number(context) == 0 || layer == layers_.end()) return nullptr;
    ++portsOpen_;
    return std::make_unique<Port>(*this, layer->second, ended_[layer->second]);
}

void FakeRenderServer::addLayer(ContextID context, ProcessID owner) {
    const std::lock_guard lock(mutex_);
    layers_.insert_or_assign(context, owner);
}

void FakeRenderServer::removeLayer(ContextID context) {
    const std::lock_guard lock(mutex_);
    layers_.erase(context);
}

void FakeRenderServer::processEnded(ProcessID owner) {
    const std::lock_guard lock(mutex_);
    ++ended_[owner];
    std::erase_if(layers_, [&](const auto& layer) { return layer.second == owner; });
}

int FakeRenderServer::portsOpen() const {
    const std::lock_guard lock(mutex_);
    return portsOpen_;
}

}  // namespace lumacast
