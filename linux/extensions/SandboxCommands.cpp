// The commands that confine a program: pure, but for a look at how this system's root directory is laid out.

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "linux/extensions/Sandbox.h"
#include "linux/ipc/ExtensionRequests.h"

namespace lumacast {

namespace {

using Words = std::vector<std::string>;

constexpr const char* kLauncherInside = "/lumacast-extension-launcher";
/// Where programs and libraries are, apart from /usr.
constexpr const char* kSystemFolders[] = {"/bin", "/sbin", "/lib", "/lib32", "/lib64", "/libx32"};
/// What the C library and the ones for the network read.
constexpr const char* kSettings[] = {
    "/etc/alternatives", "/etc/ca-certificates", "/etc/gai.conf",   "/etc/host.conf",
    "/etc/hosts",        "/etc/ld.so.cache",     "/etc/ld.so.conf", "/etc/ld.so.conf.d",
    "/etc/localtime",    "/etc/nsswitch.conf",   "/etc/pki",        "/etc/protocols",
    "/etc/resolv.conf",  "/etc/services",        "/etc/ssl/certs",  "/etc/ssl/openssl.cnf",
    "/etc/timezone"};
constexpr const char* kDevices[] = {"/dev/null", "/dev/zero", "/dev/full", "/dev/random", "/dev/urandom"};
constexpr std::uint64_t kSharedMemoryBytes = 64 << 20;

void append(Words& words, const Words& more) {
    words.insert(words.end(), more.begin(), more.end());
}

void appendLimit(Words& words, const char* name, std::uint64_t value) {
    if (value > 0) append(words, {"--limit", std::string(name) + "=" + std::to_string(value)});
}

/// /bin and its kind: links into /usr on most systems, folders of their own on others.
void appendSystemFolders(Words& words) {
    for (const std::string folder : kSystemFolders) {
        struct stat status = {};
        if (::lstat(folder.c_str(), &status) != 0) continue;
        std::error_code error;
        if (S_ISLNK(status.st_mode))
            append(words, {"--symlink", std::filesystem::read_symlink(folder, error).string(), folder});
        else
            append(words, {"--ro-bind", folder, folder});
    }
}

}  // namespace

std::vector<std::string> Sandbox::startOptions() const {
    const ExtensionResources& resources = options_.resources;
    Words words{options_.launcher, "--parent", std::to_string(::getpid()), "--oom", std::to_string(resources.badness)};
    appendLimit(words, "address-space", resources.addressSpace);
    appendLimit(words, "file-size", resources.fileBytes);
    appendLimit(words, "open-files", resources.openFiles);
    return words;
}

std::vector<std::string> Sandbox::insideBubblewrap(const std::string& folder, const Places& places, bool network,
                                                   const std::vector<std::string>& program, bool isProbe) const {
    Words words = startOptions();
    append(words, {"--", options_.bubblewrap, "--unshare-user", "--unshare-pid", "--unshare-ipc", "--unshare-uts",
                   "--unshare-cgroup-try", "--die-with-parent", "--cap-drop", "ALL", "--hostname", "extension"});
    if (!network) words.push_back("--unshare-net");
    append(words, {"--ro-bind", "/usr", "/usr"});
    appendSystemFolders(words);
    for (const std::string settings : kSettings) append(words, {"--ro-bind-try", settings, settings});
    append(words, {"--size", std::to_string(options_.resources.temporaryBytes), "--tmpfs", "/tmp", "--dev", "/dev",
                   "--size", std::to_string(kSharedMemoryBytes), "--tmpfs", "/dev/shm", "--remount-ro", "/dev"});
    // Through it a descriptor could be opened anew, with more than the rights it was given: only where the file rules
    // keep that from happening.
    if (hasLandlock_) append(words, {"--proc", "/proc"});
    if (!isProbe) {
        append(words, {"--ro-bind", folder, folder, "--bind", places.data, places.data});
        for (const std::string& directory : places.writable) append(words, {"--bind", directory, directory});
    }
    append(words, {"--ro-bind", options_.launcher, kLauncherInside, "--chdir", places.data, "--remount-ro", "/", "--",
                   kLauncherInside});
    // Bubblewrap's own processes stay in the group that the daemon ends; what it started before it could tell them to
    // end with it looks whether the daemon is still there.
    words.push_back("--session");
    if (!isProbe) append(words, {"--connected", std::to_string(kExtensionRequestsDescriptor)});
    appendLimit(words, "processes", options_.resources.processes);
    if (hasLandlock_) {
        append(words, {"--read", "/"});
        for (const std::string device : kDevices) append(words, {"--write", device});
        append(words, {"--write", "/tmp", "--write", "/dev/shm", "--write", places.data});
        for (const std::string& directory : places.writable) append(words, {"--write", directory});
    }
    append(words, {"--calls", "namespaces"});
    if (!network) words.push_back("--no-network");
    words.push_back("--");
    append(words, program);
    return words;
}

std::vector<std::string> Sandbox::withLandlock(const std::string& folder, const Places& places, bool network,
                                               const std::vector<std::string>& program) const {
    Words words = startOptions();
    words.push_back("--no-rights");
    append(words, {"--read", "/usr", "--read", folder, "--read", "/proc/self"});
    for (const std::string system : kSystemFolders) append(words, {"--read", system});
    for (const std::string settings : kSettings) append(words, {"--read", settings});
    for (const std::string device : kDevices) append(words, {"--write", device});
    append(words, {"--write", places.data});
    for (const std::string& directory : places.writable) append(words, {"--write", directory});
    append(words, {"--calls", "shared"});
    if (!network) words.push_back("--no-network");
    words.push_back("--");
    append(words, program);
    return words;
}

}  // namespace lumacast
