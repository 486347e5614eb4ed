#include "client/lumacastctl/status/StatusCommand.h"

#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/status/Status.h"
#include "linux/admin/LinuxAdminService.h"
#include "linux/admin/UnixSocket.h"

namespace lumacast::ctl {

namespace {

int complain(std::FILE* complaints, const std::string& text) {
    std::fprintf(complaints, "lumacastctl: %s\n", text.c_str());
    return kNoAnswer;
}

}  // namespace

int showStatus(const std::string& runtimeDirectory, std::FILE* out, std::FILE* complaints,
               std::chrono::milliseconds limit) {
    const std::string socket = runtimeDirectory + "/admin.sock";
    const auto answer = askAdminService(socket, "status", limit);
    if (!answer && !connectTo(socket))
        return complain(complaints,
                        "the daemon isn't running: nobody answers at " + printable(socket) +
                            ".\nStart lumacastd as this user, with the same XDG_RUNTIME_DIR, and try again; "
                            "`lumacastctl doctor` looks for what else is missing.");
    if (!answer)
        return complain(complaints,
                        "the daemon does not answer at " + printable(socket) +
                            ".\nTry again; when it stays silent, end lumacastd with SIGTERM, which finishes a movie "
                            "that is being recorded, and start it anew.");
    const auto status = readStatus(*answer);
    if (const auto* reason = std::get_if<std::string>(&status))
        return complain(complaints,
                        "the daemon has no status to give: " + printable(*reason) + "\nTry again in a moment.");
    std::fputs(statusText(std::get<DaemonStatus>(status)).c_str(), out);
    return kGood;
}

}  // namespace lumacast::ctl
