#include "client/extension/Extension.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>

#include <cstdio>
#include <memory>
#include <string_view>
#include <thread>
#include <utility>

#include "client/extension/DaemonLink.h"
#include "client/extension/HostLink.h"
#include "client/extension/World.h"
#include "linux/ipc/QuietThread.h"

namespace lumacast::extension {

namespace {

constexpr int kWrongUse = 64;

/// The descriptor, kept from programs that the extension starts; none when it is no stream socket.
Fd socketOf(int descriptor) {
    int type = 0;
    socklen_t size = sizeof type;
    if (::getsockopt(descriptor, SOL_SOCKET, SO_TYPE, &type, &size) != 0 || type != SOCK_STREAM) return Fd();
    ::fcntl(descriptor, F_SETFD, FD_CLOEXEC);
    return Fd(descriptor);
}

}  // namespace

Options::Options()
    : requestsDescriptor(kExtensionRequestsDescriptor), auxiliaryDescriptor(kExtensionAuxiliaryDescriptor) {}

void sayRefused(const char* what) { std::fprintf(stderr, "lumacast extension: refused: %s\n", what); }

void sayLogged(LogLevel level, std::string_view text) {
    if (level != LogLevel::Error) return;
    std::fprintf(stderr, "lumacast extension: %.*s\n", static_cast<int>(text.size()), text.data());
}

int run(Handler& handler, Options options) {
    Fd requests = socketOf(options.requestsDescriptor), auxiliary = socketOf(options.auxiliaryDescriptor);
    if (!requests || !auxiliary) {
        (void)requests.release(), (void)auxiliary.release();  // not ours, then
        std::fputs("This is an upload extension of lumacastd, which launches it when there is something to broadcast.\n",
                   stderr);
        return kWrongUse;
    }
    ::signal(SIGPIPE, SIG_IGN);  // a server that hangs up must not end the process
    const auto world = std::make_shared<World>();
    const auto host = std::make_shared<HostLink>(world, handler, std::move(options.exchange));
    const auto daemon = std::make_shared<DaemonLink>(world, handler);
    const auto gone = [&lane = world->lane] { lane.finish(); };
    world->lane.call([&] { handler.connected(*daemon); });
    world->reactor.async([&] {
        host->open(std::move(requests), gone);
        daemon->open(std::move(auxiliary), gone);
    });
    // The thread of the sockets. Signals are the extension's own.
    std::thread thread = quietThread([&reactor = world->reactor] { reactor.run(); });
    world->lane.run();
    handler.ended();
    world->reactor.async([&] {
        host->close();
        daemon->close();
        // Behind the loss of the connections, which is on its way through the loop.
        world->reactor.async([&] { world->reactor.requestStop(); });
    });
    thread.join();
    return 0;
}

}  // namespace lumacast::extension
