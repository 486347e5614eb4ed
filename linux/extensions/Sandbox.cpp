#include "linux/extensions/Sandbox.h"

#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <filesystem>

#include "linux/store/ProgramOutput.h"
#include "linux/system/IniFile.h"
#include "linux/system/LinuxEnvironment.h"
#include "linux/system/SmallFile.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumConfiguration = 64 * 1024;

bool kernelHasLandlock() {
    constexpr long kCreateRuleset = 444;
    constexpr unsigned kAskVersion = 1;
    return ::syscall(kCreateRuleset, nullptr, 0, kAskVersion) > 0;
}

/// The folder with all links resolved, if it is one and this user's or the administrator's.
std::optional<std::string> ownFolder(const std::string& path) {
    std::error_code error;
    const std::string real = std::filesystem::canonical(path, error).string();
    struct stat status = {};
    if (error || ::stat(real.c_str(), &status) != 0 || !S_ISDIR(status.st_mode)) return std::nullopt;
    if (status.st_uid != ::geteuid() && status.st_uid != 0) return std::nullopt;
    return real;
}

bool isSameOrBelow(std::string_view path, std::string_view folder) {
    return path == folder || (path.starts_with(folder) && path.size() > folder.size() && path[folder.size()] == '/');
}

}  // namespace

Sandbox::Sandbox(Log& log, Options options)
    : log_(log), options_(std::move(options)), hasLandlock_(options_.landlock && kernelHasLandlock()) {}

std::string Sandbox::dataDirectoryOf(const InstalledExtension& extension) const {
    return options_.ownDirectories + "/" + extension.manifest.identifier;
}

std::optional<Sandbox::Places> Sandbox::placesFor(const InstalledExtension& extension) const {
    const std::string wanted = dataDirectoryOf(extension);
    if (const auto error = makeDirectories(wanted)) {
        log_.error("%s is not launched: its directory %s can't be made: %s", extension.manifest.identifier, wanted,
                   describe(*error));
        return std::nullopt;
    }
    const auto data = ownFolder(wanted);
    if (!data) {
        log_.error("%s is not launched: its directory %s belongs to somebody else", extension.manifest.identifier,
                   wanted);
        return std::nullopt;
    }
    Places places{*data, {}};
    for (const std::string& granted : extension.manifest.grants.directories) {
        const auto folder = ownFolder(granted);
        bool isGood = folder.has_value() && *folder != "/";
        for (const std::string& forbidden : options_.forbidden)
            if (folder && (isSameOrBelow(*folder, forbidden) || isSameOrBelow(forbidden, *folder))) isGood = false;
        // What a user's own manifest grants is no more than it could write in its own directory anyway.
        if (folder && isSameOrBelow(*folder, *data))
            isGood = true;
        else if (!extension.isAdministrators)
            isGood = false;
        if (isGood)
            places.writable.push_back(*folder);
        else
            log_.error("%s is not granted the directory %s", extension.manifest.identifier, granted);
    }
    return places;
}

bool Sandbox::works(Confinement confinement) const {
    const Places nowhere{"/tmp", {}};
    const std::vector<std::string> program{"/usr/bin/env", "true"};
    std::vector<std::string> command;
    if (confinement == Confinement::Bubblewrap) {
        if (options_.bubblewrap.empty()) return false;
        command = insideBubblewrap("/usr", nowhere, true, program, true);
    } else {
        if (!hasLandlock_) return false;
        command = withLandlock("/usr", nowhere, true, program);
    }
    ProgramRun run{command, {"PATH=/usr/bin:/bin"}};
    run.patience = std::chrono::seconds(10);
    return outputOf(run, -1).has_value();
}

void Sandbox::sayOnce(std::string_view line, bool isError) {
    if (said_ == line) return;
    said_ = line;
    if (isError)
        log_.error("%s", line);
    else
        log_.line("%s", line);
}

std::optional<Confinement> Sandbox::confinement() {
    const std::lock_guard lock(mutex_);
    if (found_) return found_;
    for (const Confinement one : {Confinement::Bubblewrap, Confinement::Landlock}) {
        if (!works(one)) continue;
        found_ = one;
        if (one == Confinement::Bubblewrap)
            sayOnce(hasLandlock_ ? "extensions run in namespaces of their own, with file rules and a system call filter"
                                 : "extensions run in namespaces of their own, with a system call filter",
                    false);
        else
            sayOnce("extensions run with file rules and a system call filter alone: bubblewrap does not work here",
                    true);
        return found_;
    }
    // Not remembered: the administrator may change it.
    if (options_.isUnsandboxedAllowed && options_.isUnsandboxedAllowed()) {
        sayOnce(
            "extensions run WITHOUT a sandbox: neither bubblewrap nor Landlock works here, and the administrator has "
            "allowed it",
            true);
        return Confinement::None;
    }
    sayOnce(
        "extensions are not launched: neither bubblewrap nor Landlock works here, and the administrator has not "
        "allowed to run them without a sandbox (AllowUnsandboxedExtensions)",
        true);
    return std::nullopt;
}

std::optional<ConfinedCommand> Sandbox::commandFor(const InstalledExtension& extension) {
    const auto found = confinement();
    if (!found) return std::nullopt;
    const auto places = placesFor(extension);
    if (!places) return std::nullopt;
    ConfinedCommand command;
    command.confinement = *found;
    const bool network = extension.manifest.grants.network;
    const std::vector<std::string> program{extension.program};
    switch (*found) {
        case Confinement::Bubblewrap:
            command.arguments = insideBubblewrap(extension.folder, *places, network, program, false);
            break;
        case Confinement::Landlock:
            command.arguments = withLandlock(extension.folder, *places, network, program);
            break;
        case Confinement::None:
            command.arguments = startOptions();
            command.arguments.insert(command.arguments.end(), {"--", extension.program});
            break;
    }
    command.environment = environmentFor(extension, *places, *found);
    return command;
}

std::vector<std::string> Sandbox::environmentFor(const InstalledExtension& extension, const Places& places,
                                                 Confinement confinement) const {
    std::vector<std::string> environment = options_.baseEnvironment;
    environment.push_back("PATH=/usr/local/bin:/usr/bin:/bin");
    environment.push_back("HOME=" + places.data);
    environment.push_back("TMPDIR=" + (confinement == Confinement::Bubblewrap ? std::string("/tmp") : places.data));
    for (const std::string& name : extension.manifest.grants.environment) {
        const auto value = options_.variable ? options_.variable(name) : std::nullopt;
        if (value) environment.push_back(name + "=" + *value);
    }
    return environment;
}

bool unsandboxedExtensionsAllowed(const std::vector<std::string>& systemDirectories, unsigned owner) {
    for (const std::string& directory : systemDirectories) {
        const auto file = readSmallFile(directory + "/daemon.conf", kMaximumConfiguration);
        if (!file || file->status.st_uid != owner || (file->status.st_mode & (S_IWGRP | S_IWOTH)) != 0) continue;
        const std::string* text = IniFile::parse(file->text).find("", "AllowUnsandboxedExtensions");
        if (!text) continue;
        const Value value = iniValue(*text);
        const bool* allowed = value.as<bool>();
        return allowed && *allowed;
    }
    return false;
}

}  // namespace lumacast
