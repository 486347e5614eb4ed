#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <array>

#include "client/lumacastctl/doctor/Daemon.h"
#include "client/lumacastctl/status/Status.h"
#include "linux/admin/LinuxAdminService.h"
#include "linux/admin/UnixSocket.h"
#include "linux/ipc/Frames.h"
#include "linux/ipc/ServiceSocket.h"

namespace lumacast::ctl {

namespace {

using Clock = std::chrono::steady_clock;

constexpr char kService[] = "com.orvane.lumacastd";

bool fits(const std::string& path) { return path.size() < sizeof(sockaddr_un::sun_path); }

/// Whether the peer sends a good hello, as the daemon does to whoever connects.
bool greets(int socket, std::chrono::milliseconds patience) {
    const auto deadline = Clock::now() + patience;
    Data received;
    while (true) {
        const HelloCheck check = checkHello(received);
        if (check.state != HelloState::Incomplete) return check.state == HelloState::Good;
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now());
        pollfd waited{socket, POLLIN, 0};
        if (left.count() <= 0 || ::poll(&waited, 1, static_cast<int>(left.count())) <= 0) return false;
        std::array<std::uint8_t, 256> buffer;
        const std::size_t wanted = std::min(buffer.size(), check.size - received.size());
        const ssize_t count = ::recv(socket, buffer.data(), wanted, MSG_DONTWAIT);
        if (count <= 0) return false;
        received.insert(received.end(), buffer.begin(), buffer.begin() + count);
    }
}

}  // namespace

DaemonFacts probeDaemon(const std::string& runtimeDirectory, bool runtimeVariableIsSet,
                        std::chrono::milliseconds patience) {
    using Socket = DaemonFacts::Socket;
    DaemonFacts facts;
    facts.runtimeDirectory = runtimeDirectory;
    facts.runtimeVariableIsSet = runtimeVariableIsSet;
    facts.adminPath = runtimeDirectory + "/admin.sock";
    facts.servicePath = runtimeDirectory + "/" + kService + ".sock";
    facts.pathFits = fits(facts.adminPath) && fits(facts.servicePath);
    // This one first: a service manager may hold it, and start the daemon that opens the other.
    const ServiceCall call = callServiceSocket(runtimeDirectory, kService);
    if (call.socket) facts.service = greets(call.socket.get(), patience) ? Socket::Answers : Socket::Silent;
    else if (call.isBusy) facts.service = Socket::Silent;
    if (const auto answer = askAdminService(facts.adminPath, "status", patience)) {
        const auto status = readStatus(*answer);
        const auto* read = std::get_if<DaemonStatus>(&status);
        facts.admin = read ? Socket::Answers : Socket::Silent;
        if (read && !read->temporaryDirectory.empty()) facts.temporaryDirectory = read->temporaryDirectory;
    } else if (connectTo(facts.adminPath)) {
        facts.admin = Socket::Silent;
    }
    return facts;
}

}  // namespace lumacast::ctl
