#pragma once
#include <memory>

#include "platform/RenderServer.h"

namespace lumacast::headless {

/// Owners of synthetic windows. The process is held, so a port never answers for another process that got its number.
class SyntheticRenderServer final : public RenderServer {
public:
    std::unique_ptr<ClientPort> clientPort(ContextID context) override;
};

}  // namespace lumacast::headless
