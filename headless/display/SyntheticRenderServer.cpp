#include "headless/display/SyntheticRenderServer.h"

#include <utility>

#include "headless/display/SyntheticWindows.h"
#include "linux/display/Processes.h"

namespace lumacast::headless {

namespace {

class SyntheticClientPort final : public ClientPort {
public:
    explicit SyntheticClientPort(x11::HeldProcess owner) : owner_(std::move(owner)) {}
    std::optional<ProcessID> processIdentifier() override {
        return owner_.ended() ? std::nullopt : std::optional(owner_.pid());
    }

private:
    const x11::HeldProcess owner_;
};

}  // namespace

std::unique_ptr<ClientPort> SyntheticRenderServer::clientPort(ContextID context) {
    const auto owner = ownerOf(context);
    auto process = owner ? x11::HeldProcess::hold(*owner) : std::nullopt;
    return process ? std::make_unique<SyntheticClientPort>(std::move(*process)) : nullptr;
}

}  // namespace lumacast::headless
