// What a unit says of files and devices, as mounts of this process's own.

#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>

#include "tests/system/confine/Confine.h"

namespace lumacast::test {

namespace fs = std::filesystem;

namespace {

void check(bool worked, const std::string& what) {
    if (!worked) fail(what + ": " + std::strerror(errno));
}

void bind(const std::string& from, const std::string& to) {
    check(::mount(from.c_str(), to.c_str(), nullptr, MS_BIND | MS_REC, nullptr) == 0, "bind " + from + " to " + to);
}

void setReadOnly(const std::string& path, bool readOnly) {
    mount_attr attributes{};
    (readOnly ? attributes.attr_set : attributes.attr_clr) = MOUNT_ATTR_RDONLY;
    check(::syscall(SYS_mount_setattr, AT_FDCWD, path.c_str(), AT_RECURSIVE, &attributes, sizeof attributes) == 0,
          (readOnly ? "make read-only " : "make writable ") + path);
}

void hide(const std::string& path) {
    if (fs::exists(path)) check(::mount("none", path.c_str(), "tmpfs", MS_RDONLY, "mode=000") == 0, "hide " + path);
}

/// Only the devices that everybody has, and those that the unit names (a class by what stands for it in /dev).
void ownDevices(ServiceSection& service) {
    const std::string held = "/mnt";
    bind("/dev", held);
    check(::mount("none", "/dev", "tmpfs", MS_NOSUID, "mode=0755") == 0, "/dev");
    std::vector<std::string> wanted{"null", "zero", "full", "random", "urandom", "tty", "pts", "shm"};
    for (const std::string& word : service.words("DeviceAllow")) {
        if (word == "char-drm") wanted.push_back("dri");
        if (word == "char-nvidia-frontend") wanted.insert(wanted.end(), {"nvidia0", "nvidiactl"});
        if (word == "char-nvidia-uvm") wanted.push_back("nvidia-uvm");
    }
    for (const std::string& name : wanted) {
        const std::string from = held + "/" + name, to = "/dev/" + name;
        if (!fs::exists(from)) continue;
        if (fs::is_directory(from))
            fs::create_directory(to);
        else
            ::close(::open(to.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0600));
        bind(from, to);
    }
    fs::create_symlink("/proc/self/fd", "/dev/fd");
    check(::umount2(held.c_str(), MNT_DETACH) == 0, "umount");
}

}  // namespace

void confineFiles(ServiceSection& service) {
    check(::unshare(CLONE_NEWNS) == 0, "unshare");
    check(::mount(nullptr, "/", nullptr, MS_REC | MS_SLAVE, nullptr) == 0, "/");
    if (service.one("DevicePolicy") == "closed") ownDevices(service);
    if (service.one("ProcSubset") == "pid" || service.one("ProtectProc") == "invisible") {
        const std::string options = std::string(service.one("ProtectProc") == "invisible" ? "hidepid=invisible" : "") +
                                    (service.one("ProcSubset") == "pid" ? ",subset=pid" : "");
        check(::mount("proc", "/proc", "proc", MS_NOSUID | MS_NODEV | MS_NOEXEC, options.c_str()) == 0, "/proc");
    }
    std::vector<std::string> writable;
    for (const std::string& path : service.words("ReadWritePaths")) writable.push_back(service.moved(path));
    for (const auto& [setting, base] : {std::pair("StateDirectory", "/var/lib/"), {"CacheDirectory", "/var/cache/"}})
        for (const std::string& name : service.words(setting)) writable.push_back(service.moved(base + name));
    for (const std::string& path : writable) bind(path, path);
    if (service.one("ProtectSystem") == "strict") {
        setReadOnly("/", true);
        for (const char* kernels : {"/dev", "/proc", "/sys"}) setReadOnly(kernels, false);
    } else if (service.has("ProtectSystem")) {
        fail("knows ProtectSystem=strict only");
    }
    for (const auto& [from, to] : service.moves()) {
        const bool isHome = from.starts_with("/home/") || from.starts_with("/run/user/");
        if (!isHome) continue;
        if (service.isOn("ProtectHome"))
            hide(to);
        else if (service.one("ProtectHome") == "read-only") {
            bind(to, to);
            setReadOnly(to, true);
        }
    }
    for (const std::string& path : writable) setReadOnly(path, false);
    if (service.isOn("ProtectKernelTunables")) {
        setReadOnly("/sys", true);
        for (const char* path : {"/proc/sys", "/proc/sysrq-trigger", "/proc/irq", "/proc/bus", "/proc/acpi"})
            if (fs::exists(path)) bind(path, path), setReadOnly(path, true);
    }
    if (service.isOn("ProtectControlGroups")) setReadOnly("/sys/fs/cgroup", true);
    if (service.isOn("ProtectKernelModules")) hide("/usr/lib/modules");
    if (service.isOn("ProtectKernelLogs") && fs::exists("/dev/kmsg")) bind("/dev/null", "/dev/kmsg");
    if (service.isOn("ProtectHostname")) check(::unshare(CLONE_NEWUTS) == 0, "unshare");
    (void)service.isOn("PrivateMounts");  // they are
}

}  // namespace lumacast::test
