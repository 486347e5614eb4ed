#pragma once
#include <memory>
#include <string>

#include "linux/display/QuestionLane.h"
#include "platform/RenderServer.h"

namespace lumacast {

/// Owners of X11 windows, from the server's X-Resource extension. The process is held, so a port never answers for
/// another process that got the same number.
class X11RenderServer final : public RenderServer {
public:
    /// `display` as in $DISPLAY; without such a server no window has an owner.
    explicit X11RenderServer(std::string display) : lane_(std::move(display), "lc-owners") {}

    std::unique_ptr<ClientPort> clientPort(ContextID context) override;

private:
    x11::QuestionLane lane_;
};

}  // namespace lumacast
