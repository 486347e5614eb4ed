#include "linux/system/LinuxEnvironment.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdlib>

#include "linux/calls/FileCalls.h"
#include "linux/calls/FolderSync.h"
#include "linux/ipc/Fd.h"
#include "linux/system/IniFile.h"
#include "linux/system/SmallFile.h"
#include "linux/system/SystemError.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumConfigurationBytes = 64 * 1024;
constexpr std::size_t kMaximumDirectories = 64;
constexpr std::string_view kName = "/lumacast";

std::string withoutTrailingSlashes(std::string path) {
    while (path.ends_with('/')) path.pop_back();
    return path;
}

std::optional<std::string> absolute(const std::optional<std::string>& path) {
    if (!path || !path->starts_with('/')) return std::nullopt;
    return withoutTrailingSlashes(*path);
}

std::vector<std::string> list(const std::optional<std::string>& text, std::string_view otherwise) {
    std::vector<std::string> result;
    std::string_view rest = text && !text->empty() ? std::string_view(*text) : otherwise;
    while (!rest.empty() && result.size() < kMaximumDirectories) {
        const std::size_t colon = rest.find(':');
        if (const auto path = absolute(std::string(rest.substr(0, colon)))) result.push_back(*path);
        rest.remove_prefix(colon == std::string_view::npos ? rest.size() : colon + 1);
    }
    return result;
}

bool isDirectory(const std::string& path) {
    struct stat status = {};
    return ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

std::string rootDirectory(const LinuxEnvironment& environment) {
    for (const std::string& directory : environment.systemDirectories) {
        const auto file = readSmallFile(directory + "/daemon.conf", kMaximumConfigurationBytes);
        if (!file) continue;
        const IniFile settings = IniFile::parse(file->text);
        const std::string* root = settings.find("", "Root");
        if (root && root->starts_with('/')) return withoutTrailingSlashes(*root);
    }
    return environment.stateDirectory + "/root";
}

/// The resource bundle is looked for where the user, the administrator or the distribution installs data, then beside
/// the executable's own installation.
std::string resourceBundle(const LinuxEnvironment& environment) {
    static constexpr std::string_view kBundle = "/lumacast/Lumacast.bundle";
    std::vector<std::string> places;
    const std::size_t slash = environment.executable.rfind('/');
    if (slash != std::string::npos && slash > 0) {
        const std::size_t parent = environment.executable.rfind('/', slash - 1);
        if (parent != std::string::npos) places.push_back(environment.executable.substr(0, parent) + "/share");
    }
    places.insert(places.begin(), environment.dataDirectories.begin(), environment.dataDirectories.end());
    for (const std::string& place : places)
        if (isDirectory(place + std::string(kBundle))) return place + std::string(kBundle);
    return "/usr/share" + std::string(kBundle);
}

std::string thisExecutable() {
    std::array<char, 4096> path{};
    const ssize_t length = ::readlink("/proc/self/exe", path.data(), path.size());
    return length > 0 ? std::string(path.data(), static_cast<std::size_t>(length)) : std::string();
}

}  // namespace

LinuxEnvironment LinuxEnvironment::ofThisProcess() {
    const auto variable = [](std::string_view name) -> std::optional<std::string> {
        const char* value = ::getenv(std::string(name).c_str());
        return value ? std::optional<std::string>(value) : std::nullopt;
    };
    return from(variable, ::getuid(), thisExecutable());
}

LinuxEnvironment LinuxEnvironment::from(const Variables& variables, uid_t user, std::string executable,
                                        const std::string& systemDirectory) {
    LinuxEnvironment result;
    const std::string number = std::to_string(user);
    result.home = absolute(variables("HOME")).value_or("/var/empty/" + number);
    result.executable = std::move(executable);
    result.runtimeDirectory =
        absolute(variables("XDG_RUNTIME_DIR")).value_or("/run/user/" + number) + std::string(kName);
    result.configHome = absolute(variables("XDG_CONFIG_HOME")).value_or(result.home + "/.config");
    result.dataHome = absolute(variables("XDG_DATA_HOME")).value_or(result.home + "/.local/share");
    result.stateDirectory =
        absolute(variables("XDG_STATE_HOME")).value_or(result.home + "/.local/state") + std::string(kName);
    result.cacheDirectory =
        absolute(variables("XDG_CACHE_HOME")).value_or(result.home + "/.cache") + std::string(kName);

    const std::vector<std::string> systemConfiguration = list(variables("XDG_CONFIG_DIRS"), "/etc/xdg");
    result.configDirectories = systemConfiguration;
    result.configDirectories.insert(result.configDirectories.begin(), result.configHome);
    result.systemDirectories = below(systemConfiguration, kName.substr(1));
    result.systemDirectories.insert(result.systemDirectories.begin(), systemDirectory);
    result.dataDirectories = list(variables("XDG_DATA_DIRS"), "/usr/local/share:/usr/share");
    result.dataDirectories.insert(result.dataDirectories.begin(), result.dataHome);
    result.searchPath = list(variables("PATH"), "/usr/local/bin:/usr/bin:/bin");

    result.root = rootDirectory(result);
    result.resourceBundle = lumacast::resourceBundle(result);

    result.languageList = variables("LANGUAGE").value_or("");
    for (const std::string_view name : {"LC_ALL", "LC_MESSAGES", "LANG"})
        if (result.messageLocale.empty()) result.messageLocale = variables(name).value_or("");
    result.notifySocket = variables("NOTIFY_SOCKET").value_or("");
    result.journalStream = variables("JOURNAL_STREAM").value_or("");
    return result;
}

std::optional<LinuxEnvironment::BadDirectory> LinuxEnvironment::prepareDirectories() const {
    for (const std::string& path : {runtimeDirectory, stateDirectory, cacheDirectory}) {
        const auto bad = [&](const Error& error) {
            const std::string* text = error.localizedDescription();
            return BadDirectory{path, text ? *text : describe(error)};
        };
        if (const auto error = makeDirectories(path)) return bad(*error);
        // An existing directory of somebody else's, or one that others may write to, is not for our sockets and files.
        const Fd directory(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW));
        struct stat status = {};
        if (!directory || ::fstat(directory.get(), &status) != 0) return bad(systemError(errno));
        if (status.st_uid != ::geteuid() || (status.st_mode & (S_IWGRP | S_IWOTH)) != 0)
            return BadDirectory{path, "it is not this user's own, or others may write to it"};
    }
    return std::nullopt;
}

std::vector<std::string> LinuxEnvironment::below(const std::vector<std::string>& directories, std::string_view name) {
    std::vector<std::string> result;
    result.reserve(directories.size());
    for (const std::string& directory : directories) result.push_back(directory + "/" + std::string(name));
    return result;
}

namespace {

/// Once made, a directory stays there, whatever happens to the power.
void syncFolderOf(const std::string& path) {
    const std::string parent = path.substr(0, path.rfind('/') + 1);
    const Fd folder(calls::openAt(AT_FDCWD, parent, O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (folder) (void)syncFolder(folder.get());
}

}  // namespace

std::optional<Error> makeDirectories(const std::string& path) {
    for (std::size_t end = path.find('/', 1); true; end = path.find('/', end + 1)) {
        const std::string part = path.substr(0, end);
        if (calls::makeDirectoryAt(AT_FDCWD, part, 0700) == 0) {
            syncFolderOf(part);
        } else if (errno != EEXIST) {
            const int error = errno;
            // A parent on a read-only or foreign file system is fine as long as it is there.
            if (!isDirectory(part)) return systemError(error);
        }
        if (end == std::string::npos) break;
    }
    return isDirectory(path) ? std::nullopt : std::optional(systemError(ENOTDIR));
}

}  // namespace lumacast
