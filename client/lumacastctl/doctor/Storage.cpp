#include "client/lumacastctl/doctor/Storage.h"

#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include "client/lumacastctl/Text.h"

namespace lumacast::ctl {

namespace {

constexpr char kSubject[] = "temporary directory";

std::string withoutTrailingSlashes(std::string path) {
    while (path.size() > 1 && path.ends_with('/')) path.pop_back();
    return path;
}

Finding checkPlace(const StorageFacts& facts) {
    if (facts.state == StorageFacts::State::SomethingElse)
        return problem(
            kSubject,
            facts.path + " is no directory (links count as none), so no movie can be written; remove what is there.");
    if (!facts.isWritable)
        return problem(kSubject,
                       (facts.state == StorageFacts::State::Directory
                            ? facts.path + " can't be written to by this user"
                            : facts.path + " is missing and can't be made: " + facts.nearest +
                                  " can't be written to by this user") +
                           "; give it to the user who runs the daemon, or let Root= in /etc/lumacast/daemon.conf name "
                           "another place.");
    if (facts.state == StorageFacts::State::Missing)
        return ok(kSubject, facts.path + " is not there yet; the daemon makes it.");
    return ok(kSubject, facts.path + " can be written to.");
}

Finding checkSpace(const StorageFacts& facts) {
    if (!facts.freeBytes)
        return warning(kSubject, "how much is free at " + facts.nearest + " can't be told; look with df.");
    if (*facts.freeBytes > kNeededFreeBytes) return ok(kSubject, bytesText(*facts.freeBytes) + " are free.");
    return problem(kSubject, "only " + bytesText(*facts.freeBytes) + " are free; starts are refused unless more than " +
                                 bytesText(kNeededFreeBytes) + " are. Make room at " + facts.nearest + ".");
}

}  // namespace

StorageFacts probeStorage(const std::string& root, const std::optional<std::string>& daemonsPath) {
    StorageFacts facts;
    facts.path = root + std::string(kTemporaryDirectory);
    if (daemonsPath) facts.daemonsPath = withoutTrailingSlashes(*daemonsPath);
    struct stat status = {};
    if (::lstat(facts.path.c_str(), &status) == 0)
        facts.state = S_ISDIR(status.st_mode) ? StorageFacts::State::Directory : StorageFacts::State::SomethingElse;
    facts.nearest = facts.path;
    while (!facts.nearest.empty() && (::stat(facts.nearest.c_str(), &status) != 0 || !S_ISDIR(status.st_mode)))
        facts.nearest.resize(facts.nearest.rfind('/'));
    if (facts.nearest.empty()) facts.nearest = "/";
    facts.isWritable = ::access(facts.nearest.c_str(), W_OK | X_OK) == 0;
    struct statvfs space = {};
    if (::statvfs(facts.nearest.c_str(), &space) == 0)
        facts.freeBytes = static_cast<std::uint64_t>(space.f_bavail) * space.f_frsize;
    return facts;
}

Findings checkStorage(const StorageFacts& facts) {
    Findings findings{checkPlace(facts), checkSpace(facts)};
    if (facts.daemonsPath && *facts.daemonsPath != facts.path)
        findings.push_back(
            warning(kSubject, "the running daemon uses " + *facts.daemonsPath +
                                  " instead: it was started with other XDG variables or before daemon.conf was "
                                  "changed. Start it anew, or ask from where it was started."));
    return findings;
}

}  // namespace lumacast::ctl
