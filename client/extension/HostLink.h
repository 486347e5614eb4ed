#pragma once
// The socket on which requests come.

#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "client/extension/Clip.h"
#include "client/extension/Extension.h"
#include "client/extension/World.h"
#include "linux/ipc/ExtensionRequests.h"
#include "platform/IpcConnection.h"

namespace lumacast::extension {

/// What a request of clip mode says.
struct ClipRequest {
    Data token;
    std::string url;
    std::optional<Dictionary> userInfo;
    bool isLast = false;
};

/// None for items that are not a clip's, whole and well-typed.
std::optional<ClipRequest> clipRequestIn(const std::vector<ExtensionItem>& items);

/// Takes requests and gives answers. Everything on the reactor, but the answers.
class HostLink final : public IpcExportedObject, public std::enable_shared_from_this<HostLink> {
public:
    HostLink(std::shared_ptr<World> world, Handler& handler, TokenExchange exchange)
        : world_(std::move(world)), handler_(handler), exchange_(std::move(exchange)) {}

    /// Serves the socket; `gone` is called once when it has ended.
    void open(Fd socket, std::function<void()> gone);
    void close();

    /// Ends a request; any lane.
    void complete(std::int64_t request, const std::vector<ExtensionItem>& items);
    void cancel(std::int64_t request, const std::optional<Error>& error);

    void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message, Array arguments,
                        IpcReply reply) override;

private:
    /// A clip whose movie is on its way. Handed over in the order of the requests, whatever the exchanges take.
    struct Expected {
        std::int64_t request;
        ClipRequest clip;
        std::uint64_t number;
        std::optional<Fd> movie;  ///< none while it is on its way
    };

    void begin(std::int64_t request, const Array& items);
    void expect(std::int64_t request, ClipRequest clip);
    void arrived(std::int64_t request, Fd movie);
    void handOver(Expected expected);
    void send(ExtensionRequestHostMessage message, Array arguments);

    const std::shared_ptr<World> world_;
    Handler& handler_;
    const TokenExchange exchange_;
    std::shared_ptr<IpcConnection> connection_;
    std::deque<Expected> expected_;
    std::uint64_t clips_ = 0;
};

}  // namespace lumacast::extension
