#include "linux/library/LinuxPhotoLibrary.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <utility>
#include <variant>

#include "linux/calls/FileCalls.h"
#include "linux/library/LibraryFolder.h"
#include "linux/library/StaleParts.h"
#include "linux/library/VideosFolder.h"
#include "linux/storage/BeneathDirectory.h"
#include "linux/system/LowPriority.h"
#include "linux/system/SystemError.h"
#include "linux/system/Threads.h"

namespace lumacast {

namespace {

constexpr int kMaximumNumber = 10'000;  // of movies of the same second

using OpenedFile = std::variant<Fd, int>;

/// Never waits for the writer of a pipe, and answers regular files only.
OpenedFile openMovie(const ResolvedName& place) {
    Fd file(
        calls::openAt(place.directory.get(), place.name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    struct stat status = {};
    if (!file || ::fstat(file.get(), &status) != 0) return errno;
    if (!S_ISREG(status.st_mode)) return S_ISDIR(status.st_mode) ? EISDIR : EACCES;
    return file;
}

/// With the calling thread's rights, which are `user`'s.
OpenedFile openForUser(const std::string& path, uid_t user) {
    const auto place = resolveForUser(path, user);
    if (const int* error = std::get_if<int>(&place)) return *error;
    return openMovie(std::get<ResolvedName>(place));
}

/// A file of this process's own in a folder of its own, by no other user's link: nobody else can have put anything in
/// its place.
OpenedFile openOwn(const std::string& path) {
    auto folder = openTrusted(path.substr(0, path.rfind('/') + 1));
    if (const int* error = std::get_if<int>(&folder)) return *error;
    ResolvedName place{std::move(std::get<Fd>(folder)), path.substr(path.rfind('/') + 1)};
    auto opened = openMovie(place);
    const auto* file = std::get_if<Fd>(&opened);
    struct stat status = {};
    if (file && (::fstat(file->get(), &status) != 0 || status.st_uid != ::geteuid())) return EACCES;
    return opened;
}

/// "Recording 2026-11-21 14-05-59", a name for every file system.
std::string nameOf(time_t date) {
    if (date <= 0) date = ::time(nullptr);
    tm local{};
    ::localtime_r(&date, &local);
    char text[64];
    const std::size_t length = ::strftime(text, sizeof text, "Recording %Y-%m-%d %H-%M-%S", &local);
    return std::string(text, length);
}

/// ".mp4" of ".../movie.mp4"; that of every movie here where a name has none.
std::string extensionOf(const std::string& path) {
    const std::size_t dot = path.rfind('.');
    const std::size_t slash = path.rfind('/');
    const bool hasOne = dot != std::string::npos && dot > slash + 1 && path.size() - dot <= 8 && dot + 1 < path.size();
    return hasOne ? path.substr(dot) : ".mp4";
}

/// Gives the file the first name that is free. The name, or the error number.
std::variant<std::string, int> giveFreeName(NewFile& file, const std::string& name, const std::string& extension) {
    for (int n = 1; n <= kMaximumNumber; ++n) {
        std::string tried = name + (n > 1 ? " (" + std::to_string(n) + ")" : "") + extension;
        const int error = file.giveName(tried);
        if (error == 0) return tried;
        if (error != EEXIST) return error;
    }
    return EEXIST;
}

/// Where the copy is, or the error number; then nothing is left behind.
std::variant<std::string, int> addCopy(int movie, const std::string& path, LibraryFolder& folder, Unseen unseen,
                                       CopyBy copyBy) {
    struct stat status = {};
    if (::fstat(movie, &status) != 0) return errno;
    auto made = NewFile::in(folder.get(), unseen);
    if (const int* error = std::get_if<int>(&made)) return *error;
    auto& file = std::get<NewFile>(made);
    if (const int error = copyBytes(movie, file.get(), static_cast<std::uint64_t>(status.st_size), copyBy); error != 0)
        return error;
    if (calls::sync(file.get()) != 0) return errno;
    auto name = giveFreeName(file, nameOf(status.st_mtim.tv_sec), extensionOf(path));
    if (const int* error = std::get_if<int>(&name)) return *error;
    if (const int error = folder.sync(); error != 0) {
        calls::unlinkAt(folder.get(), std::get<std::string>(name));
        return error;
    }
    folder.keep();
    return folder.path() + "/" + std::get<std::string>(name);
}

/// As the kernel stamps files.
timespec momentOfFiles() {
    timespec now = {};
    ::clock_gettime(CLOCK_REALTIME_COARSE, &now);
    return now;
}

}  // namespace

LinuxPhotoLibrary::LinuxPhotoLibrary(Options options) : options_(std::move(options)), start_(momentOfFiles()) {}

void LinuxPhotoLibrary::removeUnfinished() {
    const std::string videos = videosFolder(options_.home, options_.configHome, options_.videosDirectory);
    const auto folder = openTrusted(withSingleSlashes(videos + "/Lumacast"));
    if (const auto* found = std::get_if<Fd>(&folder)) (void)removeStaleParts(found->get(), start_);
}

Result<URL> LinuxPhotoLibrary::addVideo(const URL& movie, UserID userID) {
    const uid_t user = number(userID);
    const std::string path = movie.path();
    if (!path.starts_with('/') || path.find('\0') != std::string::npos) return systemError(EINVAL);
    if (!canActFor(user)) return systemError(EPERM);
    const bool isOwn = user == ::geteuid();
    const auto account = isOwn ? std::nullopt : options_.accounts(user);
    if (!isOwn && (!account || !account->home.starts_with('/'))) return systemError(EPERM);
    OpenedFile source = isOwn ? OpenedFile(EACCES) : openOwn(path);

    std::string saved;
    const int error = performOnOwnThread([&] {
        runAtLowPriority();
        if (account)
            if (const int refusal = becomeUser(*account); refusal != 0) return refusal;
        if (std::holds_alternative<int>(source)) source = openForUser(path, user);
        if (const int* failure = std::get_if<int>(&source)) return *failure;
        const std::string videos = account ? videosFolder(account->home, account->home + "/.config", {})
                                           : videosFolder(options_.home, options_.configHome, options_.videosDirectory);
        auto folder = LibraryFolder::open(videos, user);
        if (const int* failure = std::get_if<int>(&folder)) return *failure;
        auto copy = addCopy(std::get<Fd>(source).get(), path, std::get<LibraryFolder>(folder), options_.unseen,
                            options_.copyBy);
        if (const int* failure = std::get_if<int>(&copy)) return *failure;
        saved = std::get<std::string>(std::move(copy));
        return 0;
    });
    if (error != 0) return systemError(error);
    return URL::file(saved);
}

}  // namespace lumacast
