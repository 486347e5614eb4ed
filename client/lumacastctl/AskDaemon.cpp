#include "client/lumacastctl/AskDaemon.h"

#include <poll.h>

#include <algorithm>

#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Text.h"
#include "linux/admin/LinuxAdminService.h"
#include "linux/admin/UnixSocket.h"
#include "linux/ipc/ServiceSocket.h"

namespace lumacast::ctl {

namespace {

constexpr std::chrono::milliseconds kTimeToStart = std::chrono::seconds(10);

/// A service manager may hold the daemon's socket and start it with the first that connects. Whether there is a daemon
/// now: whoever connects is greeted by it, and its other socket is open by then.
bool wakeDaemon(const std::string& runtimeDirectory, std::chrono::milliseconds limit) {
    const ServiceCall call = callServiceSocket(runtimeDirectory, "com.orvane.lumacastd");
    if (!call.socket) return false;
    pollfd greeting{call.socket.get(), POLLIN, 0};
    return ::poll(&greeting, 1, static_cast<int>(std::min(limit, kTimeToStart).count())) == 1;
}

}  // namespace

int complain(std::FILE* complaints, const std::string& text) {
    std::fprintf(complaints, "lumacastctl: %s\n", text.c_str());
    return kNoAnswer;
}

std::optional<std::string> askDaemon(const std::string& runtimeDirectory, const std::string& request,
                                     std::FILE* complaints, std::chrono::milliseconds limit) {
    const std::string socket = runtimeDirectory + "/admin.sock";
    auto answer = askAdminService(socket, request, limit);
    if (answer) return answer;
    if (!connectTo(socket) && wakeDaemon(runtimeDirectory, limit)) answer = askAdminService(socket, request, limit);
    if (answer) return answer;
    if (!connectTo(socket))
        complain(complaints, "the daemon isn't running: nobody answers at " + printable(socket) +
                                 ".\nStart lumacastd as this user, with the same XDG_RUNTIME_DIR, and try again; "
                                 "`lumacastctl doctor` looks for what else is missing.");
    else
        complain(complaints, "the daemon does not answer at " + printable(socket) +
                                 ".\nTry again; when it stays silent, end lumacastd with SIGTERM, which finishes a "
                                 "movie that is being recorded, and start it anew.");
    return std::nullopt;
}

}  // namespace lumacast::ctl
