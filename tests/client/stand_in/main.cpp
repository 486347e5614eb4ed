// A daemon that can be killed: it answers the first question for the state of each connection, or with "serving" all of
// them, and nothing else. Prints "ready", then the name of each message that comes, a line each. Ends with its standard
// input, so that a test that dies leaves nothing behind.

#include <sys/epoll.h>

#include <cstdio>
#include <map>
#include <memory>
#include <string>

#include "base/Log.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"

namespace {

using namespace lumacast;

class StandIn final : public IpcListenerDelegate,
                      public IpcExportedObject,
                      public std::enable_shared_from_this<StandIn> {
public:
    explicit StandIn(bool serving) : serving_(serving) {}

    bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
        connection->setExportedInterface(daemonProtocol());
        connection->setExportedObject(weak_from_this());
        connection->setRemoteInterface(clientProtocol());
        connection->resume();
        return true;
    }

    void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message, Array,
                        IpcReply reply) override {
        const std::string_view name = daemonProtocol().messages[message].name;
        std::printf("%.*s\n", static_cast<int>(name.size()), name.data());
        std::fflush(stdout);
        if (static_cast<DaemonMessage>(message) != DaemonMessage::SynchronousGetCurrentState) return;
        if (serving_ || ++questions_[connection.get()] == 1) reply({Dictionary{{"isRecording", false}}});
        else kept_.push_back(std::move(reply));
    }

private:
    const bool serving_;
    std::map<const IpcConnection*, int> questions_;
    std::vector<IpcReply> kept_;
};

}  // namespace

int main(int argc, char** argv) {
    if (argc < 2) return 2;
    Log log;
    Reactor reactor("stand-in");
    LinuxIpc ipc(reactor, log, {.runtimeDirectory = argv[1]});
    const auto listener = ipc.listenerForService("com.orvane.lumacastd");
    const auto delegate = std::make_shared<StandIn>(argc > 2 && std::string(argv[2]) == "serving");
    listener->setDelegate(delegate);
    listener->resume();
    const auto input = reactor.watch(0, EPOLLIN, [&](std::uint32_t) {
        reactor.requestStop();
        return Reactor::Again::No;
    });
    std::puts("ready");
    std::fflush(stdout);
    reactor.run();
    return 0;
}
