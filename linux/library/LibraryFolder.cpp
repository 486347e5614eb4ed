#include "linux/library/LibraryFolder.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "linux/storage/BeneathDirectory.h"
#include "linux/calls/FileCalls.h"
#include "linux/calls/FolderSync.h"

namespace lumacast {

namespace {

constexpr mode_t kMode = 0755;  // less the umask

Fd readable(int folder) {
    return Fd(calls::openAt(folder, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

}  // namespace

LibraryFolder::LibraryFolder(LibraryFolder&& other) noexcept
    : path_(std::move(other.path_)), folder_(std::move(other.folder_)), made_(std::exchange(other.made_, {})) {}

LibraryFolder::~LibraryFolder() {
    for (auto made = made_.rbegin(); made != made_.rend(); ++made)
        calls::unlinkAt(made->parent.get(), made->name, AT_REMOVEDIR);
}

std::variant<Fd, int> LibraryFolder::openOrMake(const std::string& path, uid_t user, bool isOurs) {
    const auto open = [&] { return isOurs ? openTrusted(path, user) : openFolder(path, user); };
    auto opened = open();
    const int* missing = std::get_if<int>(&opened);
    if (!missing || *missing != ENOENT) return opened;

    auto place = resolveForUser(path, user);
    if (const int* error = std::get_if<int>(&place)) return *error;
    auto& [parent, name] = std::get<ResolvedName>(place);
    if (calls::makeDirectoryAt(parent.get(), name, kMode) == 0) {
        made_.push_back({std::move(parent), std::move(name)});
    } else if (errno != EEXIST) {  // two saves may make it at once
        return errno;
    }
    return open();
}

std::variant<LibraryFolder, int> LibraryFolder::open(const std::string& videos, uid_t user) {
    LibraryFolder result;
    result.path_ = withSingleSlashes(videos + "/Lumacast");
    const auto around = result.openOrMake(withSingleSlashes(videos), user, false);
    if (const int* error = std::get_if<int>(&around)) return *error;
    const auto inside = result.openOrMake(result.path_, user, true);
    if (const int* error = std::get_if<int>(&inside)) return *error;
    result.folder_ = readable(std::get<Fd>(inside).get());
    if (!result.folder_) return errno;
    return result;
}

int LibraryFolder::sync() const {
    if (const int error = syncFolder(folder_.get()); error != 0) return error;
    for (const Made& made : made_) {
        if (const int error = syncFolder(made.parent.get()); error != 0) return error;
    }
    return 0;
}

}  // namespace lumacast
