#include "client/lumacastctl/status/StatusCommand.h"

#include "client/lumacastctl/AskDaemon.h"
#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/status/Status.h"

namespace lumacast::ctl {

int showStatus(const std::string& runtimeDirectory, std::FILE* out, std::FILE* complaints,
               std::chrono::milliseconds limit) {
    const auto answer = askDaemon(runtimeDirectory, "status", complaints, limit);
    if (!answer) return kNoAnswer;
    const auto status = readStatus(*answer);
    if (const auto* reason = std::get_if<std::string>(&status))
        return complain(complaints,
                        "the daemon has no status to give: " + printable(*reason) + "\nTry again in a moment.");
    std::fputs(statusText(std::get<DaemonStatus>(status)).c_str(), out);
    return kGood;
}

}  // namespace lumacast::ctl
