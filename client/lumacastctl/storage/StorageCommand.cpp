#include "client/lumacastctl/storage/StorageCommand.h"

#include "client/lumacastctl/AskDaemon.h"
#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/storage/Storage.h"
#include "linux/admin/LinuxAdminService.h"

namespace lumacast::ctl {

namespace {

double now() {
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

int refuse(std::FILE* complaints, const std::string& reason) {
    return complain(complaints, "the daemon can't do that: " + printable(reason) + "\nTry again in a moment.");
}

}  // namespace

int showStorage(const std::string& runtimeDirectory, StoragePart part, Form form, std::FILE* out, std::FILE* complaints,
                std::chrono::milliseconds limit) {
    auto answer = askDaemon(runtimeDirectory, "storage", complaints, limit);
    if (!answer) return kNoAnswer;
    if (part != StoragePart::Purgeable) {
        const auto movies = askAdminService(runtimeDirectory + "/admin.sock", "movies", limit);
        answer = withMovies(*answer, movies.value_or(""));
    }
    const auto read = readStorage(*answer);
    if (const auto* reason = std::get_if<std::string>(&read)) return refuse(complaints, *reason);
    const auto& report = std::get<StorageReport>(read);
    if (form == Form::Json)
        std::fprintf(out, "%s\n", answer->c_str());
    else if (part == StoragePart::Purgeable)
        std::fputs(purgeableText(report).c_str(), out);
    else if (part == StoragePart::List)
        std::fputs(filesText(report, now()).c_str(), out);
    else
        std::fprintf(out, "%s\n%s", filesText(report, now()).c_str(), purgeableText(report).c_str());
    return kGood;
}

int purgeStorage(const std::string& runtimeDirectory, std::int32_t urgency, Form form, std::FILE* out,
                 std::FILE* complaints, std::chrono::milliseconds limit) {
    const auto answer = askDaemon(runtimeDirectory, "purge " + std::to_string(urgency), complaints, limit);
    if (!answer) return kNoAnswer;
    const auto read = readPurge(*answer);
    if (const auto* reason = std::get_if<std::string>(&read)) return refuse(complaints, *reason);
    if (form == Form::Json)
        std::fprintf(out, "%s\n", answer->c_str());
    else
        std::fputs(purgeText(urgency, std::get<PurgeOutcome>(read)).c_str(), out);
    return kGood;
}

}  // namespace lumacast::ctl
