#include "linux/extensions/InstalledExtensions.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <memory>
#include <set>

#include "base/Limits.h"
#include "linux/ipc/Fd.h"
#include "platform/AppExtension.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumManifest = 64 * 1024;
constexpr std::size_t kMaximumIcon = 1024 * 1024;
constexpr std::string_view kPlace = "/lumacast/extensions";
constexpr std::string_view kManifest = "manifest.json";
constexpr std::string_view kPng("\x89PNG\r\n\x1a\n", 8);

/// Opened without leaving the folder: links within it are followed, others are not.
Fd openWithin(int folder, const std::string& path, std::uint64_t flags) {
    open_how how{};
    how.flags = flags | O_CLOEXEC;
    how.resolve = RESOLVE_BENEATH | RESOLVE_NO_MAGICLINKS;
    Fd opened(static_cast<int>(::syscall(SYS_openat2, folder, path.c_str(), &how, sizeof how)));
    if (!opened && (errno == ENOSYS || errno == EPERM))  // without that call: no links at all
        opened.reset(::openat(folder, path.c_str(), static_cast<int>(flags) | O_CLOEXEC | O_NOFOLLOW));
    return opened;
}

std::string stampOf(const struct stat& status) {
    return std::to_string(status.st_dev) + "." + std::to_string(status.st_ino) + "." + std::to_string(status.st_size) +
           "." + std::to_string(status.st_mode) + "." + std::to_string(status.st_uid) + "." +
           std::to_string(status.st_mtim.tv_sec) + "." + std::to_string(status.st_mtim.tv_nsec) + "." +
           std::to_string(status.st_ctim.tv_sec) + "." + std::to_string(status.st_ctim.tv_nsec);
}

std::string stampOf(int folder, const std::string& path) {
    struct stat status = {};
    return ::fstatat(folder, path.c_str(), &status, 0) == 0 ? stampOf(status) : std::to_string(errno);
}

/// Only this user and the administrator may be able to change what runs.
std::optional<std::string> whyNotSafe(const struct stat& status, std::string_view what) {
    if (status.st_uid != 0 && status.st_uid != ::geteuid()) return std::string(what) + " belongs to another user";
    if (!S_ISLNK(status.st_mode) && (status.st_mode & (S_IWGRP | S_IWOTH)) != 0)
        return std::string(what) + " can be written by others";
    return std::nullopt;
}

std::string realPath(int descriptor) {
    std::array<char, 4096> path{};
    const std::string link = "/proc/self/fd/" + std::to_string(descriptor);
    const ssize_t length = ::readlink(link.c_str(), path.data(), path.size());
    return length > 0 ? std::string(path.data(), static_cast<std::size_t>(length)) : std::string();
}

std::optional<std::string> readAll(int descriptor, std::size_t maximum) {
    std::string text;
    std::array<char, 8192> buffer;
    for (;;) {
        const ssize_t count = ::read(descriptor, buffer.data(), buffer.size());
        if (count < 0 && errno == EINTR) continue;
        if (count < 0) return std::nullopt;
        if (count == 0) return text;
        text.append(buffer.data(), static_cast<std::size_t>(count));
        if (text.size() > maximum) return std::nullopt;
    }
}

/// The names of the folders in a directory, sorted; the error number when it is there and can't be read.
std::variant<std::vector<std::string>, int> foldersIn(const std::string& directory) {
    const std::unique_ptr<DIR, int (*)(DIR*)> entries(::opendir(directory.c_str()), &::closedir);
    std::vector<std::string> names;
    if (!entries) {
        if (errno == ENOENT || errno == ENOTDIR) return names;
        return errno;
    }
    // Some more than are looked at may lie there: the order must not be the directory's.
    constexpr std::size_t kMaximumNames = 16 * limitOf(Limit::ExtensionsInstalled);
    while (const dirent* entry = ::readdir(entries.get())) {
        if (entry->d_name[0] == '.' || names.size() >= kMaximumNames) continue;
        struct stat status = {};
        if (::fstatat(::dirfd(entries.get()), entry->d_name, &status, 0) == 0 && S_ISDIR(status.st_mode))
            names.emplace_back(entry->d_name);
    }
    std::sort(names.begin(), names.end());
    return names;
}

}  // namespace

InstalledExtensions::InstalledExtensions(Log& log, std::vector<std::string> dataDirectories,
                                         std::vector<Locale> locales)
    : log_(log), directories_(std::move(dataDirectories)), locales_(std::move(locales)) {}

std::variant<std::shared_ptr<const InstalledExtension>, std::string> InstalledExtensions::read(
    const std::string& path, std::string& executable) const {
    const Fd folder(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    struct stat folderStatus = {}, manifestStatus = {}, programStatus = {};
    if (!folder || ::fstat(folder.get(), &folderStatus) != 0) return "its folder can't be opened";
    if (auto reason = whyNotSafe(folderStatus, "its folder")) return *reason;
    const Fd file = openWithin(folder.get(), std::string(kManifest), O_RDONLY | O_NONBLOCK | O_NOCTTY);
    if (!file || ::fstat(file.get(), &manifestStatus) != 0 || !S_ISREG(manifestStatus.st_mode))
        return "it has no manifest";
    if (auto reason = whyNotSafe(manifestStatus, "its manifest")) return *reason;
    const auto text = readAll(file.get(), kMaximumManifest);
    if (!text) return "its manifest can't be read or is too large";
    auto parsed = ExtensionManifest::parse(*text);
    if (const auto* reason = std::get_if<std::string>(&parsed)) return "its manifest is not good: " + *reason;

    auto extension = std::make_shared<InstalledExtension>();
    extension->manifest = std::move(std::get<ExtensionManifest>(parsed));
    const ExtensionManifest& manifest = extension->manifest;
    executable = manifest.executable;
    extension->folder = realPath(folder.get());
    const Fd program = openWithin(folder.get(), manifest.executable, O_PATH);
    if (!program || ::fstat(program.get(), &programStatus) != 0) return "its executable is not in its folder";
    if (!S_ISREG(programStatus.st_mode) || (programStatus.st_mode & 0111) == 0) return "its executable can't be run";
    if (auto reason = whyNotSafe(programStatus, "its executable")) return *reason;
    extension->program = realPath(program.get());
    if (!extension->program.starts_with(extension->folder + "/")) return "its executable is not in its folder";
    // Whoever may write to a folder on the way may put another program there.
    for (std::string at = extension->program; at != extension->folder && !at.empty();) {
        at.resize(at.rfind('/'));
        struct stat status = {};
        if (::lstat(at.c_str(), &status) != 0) return "its folder can't be opened";
        if (auto reason = whyNotSafe(status, "a folder of its executable")) return *reason;
    }
    extension->isAdministrators = folderStatus.st_uid == 0 && manifestStatus.st_uid == 0 && programStatus.st_uid == 0;
    if (manifest.activationRule)
        extension->attributes.set(std::string(kExtensionActivationRule), *manifest.activationRule);
    Dictionary own;
    if (!manifest.processMode.empty()) own.set("LCBroadcastProcessMode", manifest.processMode);
    extension->information.set(std::string(kExtensionDisplayName), manifest.displayName(locales_));
    extension->information.set(std::string(kExtensionDictionary), std::move(own));
    return std::shared_ptr<const InstalledExtension>(std::move(extension));
}

InstalledExtensions::Known& InstalledExtensions::known(const std::string& folder) {
    Known& known = known_[folder];
    const Fd opened(::open(folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    const auto stamp = [&opened, &known] {
        if (!opened) return std::string("none");
        std::string text = stampOf(opened.get(), std::string(kManifest)) + " " + stampOf(opened.get(), ".");
        if (!known.executable.empty()) text += " " + stampOf(opened.get(), known.executable);
        return text;
    };
    if (known.stamp == stamp()) return known;
    known.executable.clear();
    auto found = read(folder, known.executable);
    if (const auto* reason = std::get_if<std::string>(&found)) {
        known.extension = nullptr;
        log_.error("the extension in %s is passed over: %s", folder, *reason);
    } else {
        known.extension = std::get<std::shared_ptr<const InstalledExtension>>(std::move(found));
    }
    known.stamp = stamp();
    return known;
}

std::variant<std::vector<std::shared_ptr<const InstalledExtension>>, int> InstalledExtensions::look() {
    const std::lock_guard lock(mutex_);
    std::vector<std::shared_ptr<const InstalledExtension>> found;
    std::set<std::string> identifiers, present;
    for (const std::string& directory : directories_) {
        const std::string place = directory + std::string(kPlace);
        auto names = foldersIn(place);
        if (const int* error = std::get_if<int>(&names)) return *error;
        std::vector<std::shared_ptr<const InstalledExtension>> here;
        for (const std::string& name : std::get<std::vector<std::string>>(names)) {
            const std::string folder = place + "/" + name;
            present.insert(folder);
            if (auto extension = known(folder).extension) here.push_back(std::move(extension));
        }
        std::stable_sort(here.begin(), here.end(),
                         [](const auto& a, const auto& b) { return a->manifest.identifier < b->manifest.identifier; });
        for (auto& extension : here)
            if (identifiers.insert(extension->manifest.identifier).second) found.push_back(std::move(extension));
    }
    const bool tooMany = found.size() > limitOf(Limit::ExtensionsInstalled);
    if (tooMany) {
        found.resize(limitOf(Limit::ExtensionsInstalled));
        if (!saidTooMany_)
            log_.error("more than %d extensions are installed: the others are passed over",
                       static_cast<std::int64_t>(limitOf(Limit::ExtensionsInstalled)));
    }
    saidTooMany_ = tooMany;
    std::erase_if(known_, [&](const auto& entry) { return !present.contains(entry.first); });
    return found;
}

std::vector<Data> readIcons(const InstalledExtension& extension) {
    std::vector<Data> icons;
    const Fd folder(::open(extension.folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    for (const std::string& path : extension.manifest.icons) {
        const Fd file = openWithin(folder.get(), path, O_RDONLY | O_NONBLOCK | O_NOCTTY);
        struct stat status = {};
        if (!file || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) continue;
        const auto text = readAll(file.get(), kMaximumIcon);
        if (text && text->starts_with(kPng)) icons.emplace_back(text->begin(), text->end());
    }
    return icons;
}

}  // namespace lumacast
