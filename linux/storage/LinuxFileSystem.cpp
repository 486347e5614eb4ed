#include "linux/storage/LinuxFileSystem.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdio>

#include "linux/calls/FileCalls.h"
#include "linux/calls/FolderSync.h"
#include "linux/storage/UsersFiles.h"
#include "linux/system/LinuxEnvironment.h"
#include "linux/system/SystemError.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumNames = 100'000;

template <class T>
Result<T> resultOf(std::variant<T, int> answer) {
    if (const int* error = std::get_if<int>(&answer)) return systemError(*error);
    return std::get<0>(std::move(answer));
}

/// For questions without an answer of their own.
struct Done {};

std::optional<Error> errorOf(const std::variant<Done, int>& answer) {
    const int* error = std::get_if<int>(&answer);
    return error ? std::optional(systemError(*error)) : std::nullopt;
}

Date dateOf(const statx_timestamp& time) {
    return Date{static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9};
}

Date wallTime() {
    timespec time{};
    ::clock_gettime(CLOCK_REALTIME, &time);
    return Date{static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9};
}

}  // namespace

/// What a question needs of the object; owned by the question too, which may outlive the object.
struct LinuxFileSystem::Place {
    Place(std::string theRoot, std::string theDirectory, Resolution theResolution, std::function<void()> before)
        : root(std::move(theRoot)),
          directory(std::move(theDirectory)),
          resolution(theResolution),
          beforeEachQuestion(std::move(before)) {}

    std::string root;
    std::string directory;
    Resolution resolution = Resolution::Walk;
    std::function<void()> beforeEachQuestion;
    mutable std::atomic<bool> directoryWasThere{false};

    std::variant<ResolvedName, int> resolve(const std::string& path) const {
        if (beforeEachQuestion) beforeEachQuestion();
        return resolveBeneath(directory, path, resolution);
    }

    /// Calls `action` with the folder's descriptor and the name; it answers 0 or -1 with errno.
    template <class Action>
    std::variant<Done, int> perform(const std::string& path, Action action) const {
        const auto place = resolve(path);
        if (const int* error = std::get_if<int>(&place)) return *error;
        const auto& [folder, name] = std::get<ResolvedName>(place);
        if (action(folder.get(), name) != 0) return errno;
        return Done{};
    }

    bool isDirectory(const std::string& path) const { return withSingleSlashes(path) == directory; }

    /// Opens a directory, following a link only for the temporary directory itself.
    std::variant<Fd, int> open(const std::string& path, int flags) const {
        const auto place = resolve(path);
        if (const int* error = std::get_if<int>(&place)) return *error;
        const auto& [folder, name] = std::get<ResolvedName>(place);
        if (!isDirectory(path)) return reopened(folder.get(), name.c_str(), flags | O_NOFOLLOW);
        auto opened = openTrusted(directory);
        if (std::holds_alternative<int>(opened)) return opened;
        directoryWasThere = true;
        if ((flags & O_PATH) != 0) return opened;
        return reopened(std::get<Fd>(opened).get(), ".", flags);
    }

    /// As `open`, for the temporary directory: one that was there and is gone is made again, with its parents, so that
    /// whoever cleans up under a running daemon does not end its service.
    std::variant<Fd, int> openDirectoryAgain() const {
        auto opened = open(directory, O_PATH);
        const int* error = std::get_if<int>(&opened);
        if (!error || *error != ENOENT || !directoryWasThere) return opened;
        if (makeDirectories(directory)) return opened;
        return open(directory, O_PATH);
    }

private:
    static std::variant<Fd, int> reopened(int folder, const char* name, int flags) {
        Fd file(calls::openAt(folder, name, flags | O_CLOEXEC));
        if (!file) return errno;
        return file;
    }
};

LinuxFileSystem::LinuxFileSystem(Options options)
    : place_(std::make_shared<const Place>(
          options.root, withSingleSlashes(options.root + std::string(kDeviceTemporaryDirectory)),
          options.resolution ? *options.resolution : availableResolution(), options.beforeEachQuestion)),
      bytesBeingWritten_(options.bytesBeingWritten),
      patience_(options.patience),
      freeSizeStands_(options.freeSizeStands),
      accounts_(std::move(options.accounts)) {}

std::optional<Error> LinuxFileSystem::prepare() {
    const std::string parent = place_->directory.substr(0, place_->directory.rfind('/'));
    if (auto error = makeDirectories(parent)) return error;
    // What somebody else put in its place, or on the way to it, is found now and not by the first recording.
    const auto opened = place_->open(place_->directory, O_PATH);
    const int* error = std::get_if<int>(&opened);
    return error && *error != ENOENT ? std::optional(systemError(*error)) : std::nullopt;
}

template <class T>
std::variant<T, int> LinuxFileSystem::ask(std::function<std::variant<T, int>(const Place&)> question) {
    const auto asked = [place = place_, question = std::move(question)] { return question(*place); };
    auto answer = disk_.ask<std::variant<T, int>>(patience_, asked);
    if (!answer) return ETIMEDOUT;
    return std::move(*answer);
}

std::string LinuxFileSystem::root() const { return place_->root; }

bool LinuxFileSystem::exists(const std::string& path) {
    const auto answer = ask<Done>([path](const Place& place) {
        return place.perform(path, [](int folder, const std::string& name) {
            struct stat status = {};
            return ::fstatat(folder, name.c_str(), &status, AT_SYMLINK_NOFOLLOW);
        });
    });
    return std::holds_alternative<Done>(answer);
}

std::optional<Error> LinuxFileSystem::createDirectory(const std::string& path) {
    return errorOf(ask<Done>([path](const Place& place) {
        auto answer = place.perform(path, [](int folder, const std::string& name) {
            const int made = calls::makeDirectoryAt(folder, name, 0700);
            if (made == 0) (void)syncFolder(folder);  // a movie in it is on the disk only if the directory is
            return made;
        });
        if (std::holds_alternative<Done>(answer) && place.isDirectory(path)) place.directoryWasThere = true;
        return answer;
    }));
}

Result<FileAttributes> LinuxFileSystem::attributes(const std::string& path) {
    // A writer that has buffered bytes knows better than the disk, and also when the disk does not answer at all.
    const std::optional<std::uint64_t> written =
        bytesBeingWritten_ ? bytesBeingWritten_(withSingleSlashes(path)) : std::nullopt;
    auto answer = ask<FileAttributes>([path](const Place& place) -> std::variant<FileAttributes, int> {
        struct statx status = {};
        constexpr unsigned kWanted = STATX_BASIC_STATS | STATX_BTIME;
        if (place.isDirectory(path)) {
            const auto opened = place.open(path, O_PATH);
            if (const int* error = std::get_if<int>(&opened)) return *error;
            if (::statx(std::get<Fd>(opened).get(), "", AT_EMPTY_PATH, kWanted, &status) != 0) return errno;
        } else {
            const auto outcome = place.perform(path, [&](int folder, const std::string& name) {
                return ::statx(folder, name.c_str(), AT_SYMLINK_NOFOLLOW, kWanted, &status);
            });
            if (const int* error = std::get_if<int>(&outcome)) return *error;
        }
        FileAttributes result;
        result.size = status.stx_size;
        result.modified = dateOf(status.stx_mtime);
        if ((status.stx_mask & STATX_BTIME) != 0) result.created = dateOf(status.stx_btime);
        result.isDirectory = S_ISDIR(status.stx_mode);
        return result;
    });
    if (written) {
        const int* error = std::get_if<int>(&answer);
        if (error && *error == ETIMEDOUT) return FileAttributes{*written, wallTime(), std::nullopt, false};
        if (!error) std::get<FileAttributes>(answer).size = *written;
    }
    return resultOf(std::move(answer));
}

UserID LinuxFileSystem::user() const { return UserID{::geteuid()}; }

bool LinuxFileSystem::userMayReadAndRemove(UserID user, const std::string& path) {
    const auto answer = ask<Done>([user, path, accounts = accounts_](const Place& place) -> std::variant<Done, int> {
        if (place.beforeEachQuestion) place.beforeEachQuestion();
        const auto own = place.openDirectoryAgain();
        struct stat ours = {};
        const auto* const folder = std::get_if<Fd>(&own);
        if (!folder && std::get<int>(own) != ENOENT) return std::get<int>(own);
        if (folder && ::fstat(folder->get(), &ours) != 0) return errno;
        const int error = performAs(number(user), accounts, [&] {
            return mayReadAndRemove(path, number(user), folder ? &ours : nullptr);
        });
        if (error != 0) return error;
        return Done{};
    });
    return std::holds_alternative<Done>(answer);
}

std::optional<Error> LinuxFileSystem::removeForUser(UserID user, const std::string& path) {
    const int error = performAs(number(user), accounts_, [&] { return removeFile(path, number(user)); });
    return error == 0 ? std::nullopt : std::optional(systemError(error));
}

Result<std::uint64_t> LinuxFileSystem::freeSize(const std::string& path) {
    const auto answer = ask<std::uint64_t>([path](const Place& place) -> std::variant<std::uint64_t, int> {
        const auto opened = place.isDirectory(path) ? place.openDirectoryAgain() : place.open(path, O_PATH);
        if (const int* error = std::get_if<int>(&opened)) return *error;
        struct statvfs status = {};
        if (calls::statFileSystem(std::get<Fd>(opened).get(), status) != 0) return errno;
        return static_cast<std::uint64_t>(status.f_bavail) * status.f_frsize;
    });
    return resultOf(freeSizeNowOrBefore(path, answer));
}

std::variant<std::uint64_t, int> LinuxFileSystem::freeSizeNowOrBefore(const std::string& path,
                                                                      const std::variant<std::uint64_t, int>& now) {
    const auto moment = std::chrono::steady_clock::now();
    const std::lock_guard lock(mutex_);
    if (const auto* bytes = std::get_if<std::uint64_t>(&now)) {
        lastFreeSize_ = FreeSize{path, *bytes, moment};
    } else if (std::get<int>(now) == ETIMEDOUT && lastFreeSize_ && lastFreeSize_->path == path &&
               moment - lastFreeSize_->told < freeSizeStands_) {
        return lastFreeSize_->bytes;
    }
    return now;
}

Result<std::vector<std::string>> LinuxFileSystem::list(const std::string& path) {
    auto opened = place_->open(path, O_RDONLY | O_DIRECTORY);
    if (const int* error = std::get_if<int>(&opened)) return systemError(*error);
    auto& directory = std::get<Fd>(opened);
    const std::unique_ptr<DIR, int (*)(DIR*)> entries(::fdopendir(directory.get()), &::closedir);
    if (!entries) return systemError(errno);
    (void)directory.release();  // the stream closes it
    std::vector<std::string> names;
    errno = 0;
    while (const dirent* entry = ::readdir(entries.get())) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != ".." && names.size() < kMaximumNames) names.emplace_back(name);
        errno = 0;
    }
    if (errno != 0) return systemError(errno);
    return names;
}

std::optional<Error> LinuxFileSystem::remove(const std::string& path) {
    const auto place = place_->resolve(path);
    if (const int* error = std::get_if<int>(&place)) return systemError(*error);
    const auto& [folder, name] = std::get<ResolvedName>(place);
    const int error = removeTree(folder.get(), name);
    return error == 0 ? std::nullopt : std::optional(systemError(error));
}

std::optional<Error> LinuxFileSystem::move(const std::string& from, const std::string& to) {
    const auto source = place_->resolve(from);
    if (const int* error = std::get_if<int>(&source)) return systemError(*error);
    const auto destination = place_->resolve(to);
    if (const int* error = std::get_if<int>(&destination)) return systemError(*error);
    const auto& a = std::get<ResolvedName>(source);
    const auto& b = std::get<ResolvedName>(destination);
    if (calls::rename(a.directory.get(), a.name, b.directory.get(), b.name) != 0)
        return systemError(errno);
    return std::nullopt;
}

}  // namespace lumacast
