#include "client/lumacastctl/status/StatusCommand.h"

#include "client/lumacastctl/AskDaemon.h"
#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/status/Status.h"

namespace lumacast::ctl {

namespace {

/// To the upper left corner, and clear from there on (ECMA-48 CUP and ED).
constexpr char kClear[] = "\033[H\033[J";

std::string blockText(const std::string& answer) {
    const auto status = readStatus(answer);
    if (const auto* reason = std::get_if<std::string>(&status)) return "No status: " + printable(*reason) + "\n";
    return recordingsTable(std::get<DaemonStatus>(status));
}

}  // namespace

int showStatus(const std::string& runtimeDirectory, Form form, std::FILE* out, std::FILE* complaints,
               std::chrono::milliseconds limit) {
    const auto answer = askDaemon(runtimeDirectory, "status", complaints, limit);
    if (!answer) return kNoAnswer;
    const auto status = readStatus(*answer);
    if (const auto* reason = std::get_if<std::string>(&status))
        return complain(complaints,
                        "the daemon has no status to give: " + printable(*reason) + "\nTry again in a moment.");
    if (form == Form::Json)
        std::fprintf(out, "%s\n", answer->c_str());
    else
        std::fputs(statusText(std::get<DaemonStatus>(status)).c_str(), out);
    return kGood;
}

int watchStatus(const std::string& runtimeDirectory, Form form, Screen screen, std::FILE* out, std::FILE* complaints,
                const std::function<bool()>& nextRound, std::chrono::milliseconds limit) {
    do {
        const auto answer = askDaemon(runtimeDirectory, "status", complaints, limit);
        if (!answer) return kNoAnswer;
        std::string block;
        if (form == Form::Json) block = *answer + "\n";
        else if (screen == Screen::Terminal) block = kClear + blockText(*answer);
        else block = blockText(*answer) + "\n";
        if (std::fputs(block.c_str(), out) < 0 || std::fflush(out) != 0) return kNoAnswer;  // who called says so
    } while (nextRound());
    return kGood;
}

}  // namespace lumacast::ctl
