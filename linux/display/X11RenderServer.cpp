#include "linux/display/X11RenderServer.h"

#include <optional>

#include "linux/display/WindowOwner.h"
#include "linux/system/HeldProcess.h"

namespace lumacast {
namespace {

using x11::X11Connection;

class X11ClientPort final : public ClientPort {
public:
    explicit X11ClientPort(std::shared_ptr<const HeldProcess> owner) : owner_(std::move(owner)) {}
    std::optional<ProcessID> processIdentifier() override {
        if (owner_->hasEnded()) return std::nullopt;
        return owner_->pid();
    }

private:
    const std::shared_ptr<const HeldProcess> owner_;
};

bool windowExists(X11Connection& connection, xcb_window_t window) {
    xcb_connection_t* const x = connection.get();
    return x11::Owned<xcb_get_window_attributes_reply_t>(
               xcb_get_window_attributes_reply(x, xcb_get_window_attributes(x, window), nullptr)) != nullptr;
}

// Asked twice: the process that is held is the owner only if it still owns the window afterwards.
std::shared_ptr<const HeldProcess> findOwner(X11Connection& connection, xcb_window_t window) {
    if (window == XCB_NONE || connection.isRoot(window) || !windowExists(connection, window)) return nullptr;
    const auto pid = x11::ownerOf(connection, window);
    if (!pid) return nullptr;
    auto process = HeldProcess::hold(*pid);
    if (!process || !windowExists(connection, window) || x11::ownerOf(connection, window) != pid) return nullptr;
    return std::make_shared<const HeldProcess>(std::move(*process));
}

}  // namespace

std::unique_ptr<ClientPort> X11RenderServer::clientPort(ContextID context) {
    using Owner = std::shared_ptr<const HeldProcess>;
    const std::function<Owner(X11Connection&)> question = [window = number(context)](X11Connection& connection) {
        return findOwner(connection, window);
    };
    auto owner = lane_.ask<Owner>(question, nullptr);
    return owner ? std::make_unique<X11ClientPort>(std::move(owner)) : nullptr;
}

}  // namespace lumacast
