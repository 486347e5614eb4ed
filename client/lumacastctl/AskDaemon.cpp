#include "client/lumacastctl/AskDaemon.h"

#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Text.h"
#include "linux/admin/LinuxAdminService.h"
#include "linux/admin/UnixSocket.h"

namespace lumacast::ctl {

int complain(std::FILE* complaints, const std::string& text) {
    std::fprintf(complaints, "lumacastctl: %s\n", text.c_str());
    return kNoAnswer;
}

std::optional<std::string> askDaemon(const std::string& runtimeDirectory, const std::string& request,
                                     std::FILE* complaints, std::chrono::milliseconds limit) {
    const std::string socket = runtimeDirectory + "/admin.sock";
    auto answer = askAdminService(socket, request, limit);
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
