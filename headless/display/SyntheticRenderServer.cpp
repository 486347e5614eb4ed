#include "headless/display/SyntheticRenderServer.h"

#include <utility>

#include "headless/display/SyntheticWindows.h"
#include "linux/system/HeldProcess.h"

namespace lumacast::headless {

namespace {

class SyntheticClientPort final : public ClientPort {
public:
    explicit SyntheticClientPort(HeldProcess owner) : owner_(std::move(owner)) {}
    std::optional<ProcessID> processIdentifier() override {
        return owner_.hasEnded() ? std::nullopt : std::optional(owner_.pid());
    }

private:
    const HeldProcess owner_;
};

}  // namespace

std::unique_ptr<ClientPort> SyntheticRenderServer::clientPort(ContextID context) {
    const auto owner = ownerOf(context);
    auto process = owner ? HeldProcess::hold(*owner) : std::nullopt;
    return process ? std::make_unique<SyntheticClientPort>(std::move(*process)) : nullptr;
}

}  // namespace lumacast::headless
