#include "client/lumacastctl/usage/UsageCommand.h"

#include "client/lumacastctl/AskDaemon.h"
#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/usage/Usage.h"

namespace lumacast::ctl {

int showUsage(const std::string& runtimeDirectory, Form form, std::FILE* out, std::FILE* complaints,
              std::chrono::milliseconds limit) {
    const auto answer = askDaemon(runtimeDirectory, "usage", complaints, limit);
    if (!answer) return kNoAnswer;
    const auto read = readUsage(*answer);
    if (const auto* reason = std::get_if<std::string>(&read))
        return complain(complaints, "no usage to show: " + printable(*reason) + "\nTry again in a moment.");
    if (form == Form::Json)
        std::fprintf(out, "%s\n", answer->c_str());
    else
        std::fputs(usageText(std::get<UsageReport>(read)).c_str(), out);
    return kGood;
}

}  // namespace lumacast::ctl
