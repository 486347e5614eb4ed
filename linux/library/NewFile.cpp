#include "linux/library/NewFile.h"

#include <fcntl.h>
#include <stdio.h>
#include <sys/random.h>
#include <sys/stat.h>

#include <cerrno>
#include <utility>

#include "linux/calls/FileCalls.h"
#include "linux/system/FileLock.h"

namespace lumacast {

namespace {

constexpr mode_t kMode = 0644;  // less the umask
constexpr int kAttempts = 100;
constexpr std::string_view kPrefix = ".lumacast-", kSuffix = ".part";

std::string randomName() {
    std::uint64_t number = 0;
    if (::getrandom(&number, sizeof number, GRND_NONBLOCK) != sizeof number) return {};
    char text[48];
    std::snprintf(text, sizeof text, "%s%016llx%s", std::string(kPrefix).c_str(), static_cast<unsigned long long>(number),
                  std::string(kSuffix).c_str());
    return text;
}

}  // namespace

std::variant<NewFile, int> NewFile::in(int folder, Unseen unseen) {
    if (unseen == Unseen::WithoutName) {
        Fd file(calls::openAt(folder, ".", O_TMPFILE | O_RDWR | O_CLOEXEC, kMode));
        if (file) return NewFile(folder, std::move(file), {});
        // What a file system, or a kernel, that can't says: the flag is unknown, or "." is a directory and no more.
        if (errno != EOPNOTSUPP && errno != EISDIR && errno != EINVAL && errno != ENOENT) return errno;
    }
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
        std::string name = randomName();
        if (name.empty()) return EAGAIN;
        Fd file(
            calls::openAt(folder, name, O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, kMode));
        if (file) {
            (void)markBeingWritten(file.get());  // it is new: nobody else's
            return NewFile(folder, std::move(file), std::move(name));
        }
        if (errno != EEXIST) return errno;
    }
    return EEXIST;
}

bool isHiddenName(std::string_view name) {
    constexpr std::size_t kDigits = 16;
    return name.size() == kPrefix.size() + kDigits + kSuffix.size() && name.starts_with(kPrefix) &&
           name.ends_with(kSuffix) &&
           name.substr(kPrefix.size(), kDigits).find_first_not_of("0123456789abcdef") == std::string_view::npos;
}

NewFile::NewFile(int folder, Fd file, std::string hiddenName)
    : folder_(folder), file_(std::move(file)), hiddenName_(std::move(hiddenName)) {}

NewFile::NewFile(NewFile&& other) noexcept
    : folder_(other.folder_), file_(std::move(other.file_)), hiddenName_(std::exchange(other.hiddenName_, {})) {}

NewFile::~NewFile() {
    if (!hiddenName_.empty()) calls::unlinkAt(folder_, hiddenName_);
}

int NewFile::giveName(const std::string& name) {
    return hiddenName_.empty() ? giveNameToUnnamed(name) : giveNameToHidden(name);
}

int NewFile::giveNameToUnnamed(const std::string& name) {
    const std::string itself = "/proc/self/fd/" + std::to_string(file_.get());
    if (calls::link(AT_FDCWD, itself, folder_, name, AT_SYMLINK_FOLLOW) == 0) return 0;
    if (errno != ENOENT) return errno;
    // Without /proc only who may read everything can do it by the descriptor.
    return calls::link(file_.get(), "", folder_, name, AT_EMPTY_PATH) == 0 ? 0 : errno;
}

int NewFile::giveNameToHidden(const std::string& name) {
    const std::string& from = hiddenName_;
    const std::string& to = name;
    const auto cannot = [] { return errno == EINVAL || errno == ENOSYS || errno == EOPNOTSUPP || errno == EPERM; };
    if (calls::renameToNew(folder_, from, folder_, to) == 0) {
        hiddenName_.clear();
        return 0;
    }
    if (!cannot()) return errno;
    if (calls::link(folder_, from, folder_, to, 0) == 0) return 0;  // the hidden name goes at the end
    if (!cannot()) return errno;
    // A file system with neither: an empty file of ours takes the name, and is what is replaced.
    const Fd place(calls::openAt(folder_, to, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, kMode));
    if (!place) return errno;
    if (calls::rename(folder_, from, folder_, to) == 0) {
        hiddenName_.clear();
        return 0;
    }
    const int error = errno;
    calls::unlinkAt(folder_, to);
    return error;
}

}  // namespace lumacast
