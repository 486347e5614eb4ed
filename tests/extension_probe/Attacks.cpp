#include "tests/extension_probe/Attacks.h"

#include <fcntl.h>
#include <linux/netlink.h>
#include <sched.h>
#include <signal.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/resource.h>
#include <sys/shm.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/uio.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstring>
#include <filesystem>

namespace lumacast::probe {

namespace {

std::string name(int error) {
    const char* text = ::strerrorname_np(error);
    return text ? text : std::to_string(error);
}

std::string outcome(long result) {
    return result >= 0 ? "0" : name(errno);
}

long connectTo(const char* path, bool isAbstract, int type) {
    const int socket = ::socket(AF_UNIX, type, 0);
    if (socket < 0) return -1;
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path + (isAbstract ? 1 : 0), path, sizeof address.sun_path - 2);
    const socklen_t length =
        static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + strlen(path) + (isAbstract ? 1 : 0));
    const long result = ::connect(socket, reinterpret_cast<sockaddr*>(&address), length);
    const int error = errno;
    ::close(socket);
    errno = error;
    return result;
}

/// A datagram socket that was made connected, connected to another.
long reconnectPair() {
    int pair[2];
    if (::socketpair(AF_UNIX, SOCK_DGRAM, 0, pair) != 0) return -1;
    return 0;
}

long cloneWith(unsigned long flags) {
    const long child = ::syscall(SYS_clone, flags | SIGCHLD, nullptr, nullptr, nullptr, nullptr);
    if (child == 0) ::_exit(0);
    return child;
}

long clone3() {
    struct {
        std::uint64_t flags, pidfd, childTid, parentTid, exitSignal, stack, stackSize, tls;
    } arguments{CLONE_NEWUSER, 0, 0, 0, SIGCHLD, 0, 0, 0};
    const long child = ::syscall(SYS_clone3, &arguments, sizeof arguments);
    if (child == 0) ::_exit(0);
    return child;
}

}  // namespace

Outcomes attackEverything(int victim) {
    Outcomes done;
    const auto attempt = [&done](const char* what, long result) { done.emplace_back(what, outcome(result)); };
    char byte = 0;
    iovec local{&byte, 1}, remote{reinterpret_cast<void*>(0x1000), 1};
    attempt("ptrace-attach", ::ptrace(PTRACE_ATTACH, victim, nullptr, nullptr));
    attempt("ptrace-seize", ::ptrace(PTRACE_SEIZE, victim, nullptr, nullptr));
    attempt("ptrace-init", ::ptrace(PTRACE_SEIZE, 1, nullptr, nullptr));
    attempt("read-memory", ::process_vm_readv(victim, &local, 1, &remote, 1, 0));
    attempt("write-memory", ::process_vm_writev(victim, &local, 1, &remote, 1, 0));
    attempt("signal", ::kill(victim, 0));
    attempt("queue-signal", ::syscall(SYS_rt_sigqueueinfo, victim, 0, &local));
    const long victimFd = ::syscall(SYS_pidfd_open, victim, 0);
    attempt("signal-by-descriptor", victimFd < 0 ? -1 : ::syscall(SYS_pidfd_send_signal, victimFd, 0, nullptr, 0));
    attempt("take-descriptor", ::syscall(SYS_pidfd_getfd, victimFd, 0, 0));
    rlimit limits{1, 1};
    attempt("limit-other", ::prlimit(static_cast<pid_t>(victim), RLIMIT_NOFILE, nullptr, &limits));
    attempt("priority-other", ::setpriority(PRIO_PROCESS, static_cast<id_t>(victim), 19));
    attempt("user-namespace", ::unshare(CLONE_NEWUSER));
    attempt("mount-namespace", ::unshare(CLONE_NEWNS));
    attempt("clone-user-namespace", cloneWith(CLONE_NEWUSER));
    attempt("clone3-user-namespace", clone3());
    attempt("enter-namespace", ::setns(0, 0));
    attempt("mount", ::mount("none", "/tmp", "tmpfs", 0, nullptr));
    attempt("remount", ::mount("none", "/usr", nullptr, MS_REMOUNT | MS_BIND, nullptr));
    attempt("unmount", ::umount2("/usr", MNT_DETACH));
    attempt("open-tree", ::syscall(SYS_open_tree, AT_FDCWD, "/", 1));
    attempt("change-root", ::chroot("/usr"));
    attempt("pivot-root", ::syscall(SYS_pivot_root, "/tmp", "/tmp"));
    attempt("load-kernel", ::syscall(SYS_kexec_load, 0, 0, nullptr, 0));
    attempt("load-module", ::syscall(SYS_init_module, nullptr, 0, ""));
    attempt("bpf", ::syscall(SYS_bpf, 0, nullptr, 0));
    attempt("perf", ::syscall(SYS_perf_event_open, nullptr, 0, -1, -1, 0));
    attempt("keys", ::syscall(SYS_keyctl, 0, -3, 0));
    attempt("add-key", ::syscall(SYS_add_key, "user", "x", "y", 1, -3));
    attempt("io-uring", ::syscall(SYS_io_uring_setup, 1, nullptr));
    attempt("userfault", ::syscall(SYS_userfaultfd, 0));
    attempt("file-handle", ::syscall(SYS_open_by_handle_at, AT_FDCWD, nullptr, 0));
    attempt("reboot", ::syscall(SYS_reboot, 0, 0, 0, nullptr));
    attempt("kernel-log", ::syscall(SYS_syslog, 10, nullptr, 0));
    const timeval now{1, 0};
    attempt("set-clock", ::settimeofday(&now, nullptr));
    attempt("host-name", ::sethostname("x", 1));
    attempt("swap", ::syscall(SYS_swapoff, "/x"));
    attempt("new-rights", ::prctl(PR_SET_NO_NEW_PRIVS, 0, 0, 0, 0));
    attempt("display", connectTo("/tmp/.X11-unix/X0", false, SOCK_STREAM));
    attempt("abstract-display", connectTo("/tmp/.X11-unix/X0", true, SOCK_STREAM));
    attempt("bus", connectTo("/run/dbus/system_bus_socket", false, SOCK_STREAM));
    attempt("journal", connectTo("/run/systemd/journal/socket", false, SOCK_DGRAM));
    attempt("local-socket", ::socket(AF_UNIX, SOCK_STREAM, 0));
    attempt("datagram-pair", reconnectPair());
    attempt("packet-socket", ::socket(AF_PACKET, SOCK_RAW, 0));
    attempt("raw-socket", ::socket(AF_INET, SOCK_RAW, 1));
    attempt("kernel-crypto", ::socket(AF_ALG, SOCK_SEQPACKET, 0));
    attempt("audit-socket", ::socket(AF_NETLINK, SOCK_RAW, NETLINK_AUDIT));
    attempt("vsock", ::socket(AF_VSOCK, SOCK_STREAM, 0));
    attempt("terminal-input", ::ioctl(0, TIOCSTI, &byte));
    attempt("make-device", ::mknod("/tmp/device", S_IFCHR | 0600, (1 << 8) | 5));
    attempt("kernel-setting", ::open("/proc/sys/kernel/core_pattern", O_WRONLY));
    attempt("sysrq", ::open("/proc/sysrq-trigger", O_WRONLY));
    attempt("memory-device", ::open("/dev/mem", O_RDWR));
    attempt("disk-device", ::open("/dev/vda", O_RDONLY));
    attempt("init-memory", ::open("/proc/1/mem", O_RDONLY));
    attempt("init-root", ::open("/proc/1/root/etc/passwd", O_RDONLY));
    attempt("victim-memory", ::open(("/proc/" + std::to_string(victim) + "/mem").c_str(), O_RDWR));
    attempt("victim-environment", ::open(("/proc/" + std::to_string(victim) + "/environ").c_str(), O_RDONLY));
    attempt("write-program", ::open("/proc/self/exe", O_WRONLY));
    attempt("write-usr", ::open("/usr/bin/written-by-extension", O_WRONLY | O_CREAT, 0600));
    attempt("write-root", ::open("/written-by-extension", O_WRONLY | O_CREAT, 0600));
    return done;
}

std::string openedAs(const std::string& path) {
    std::error_code error;
    if (std::filesystem::is_directory(path, error)) {
        const std::string inside = path + "/probe";
        const int made = ::open(inside.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
        if (made >= 0) {
            ::close(made);
            ::unlink(inside.c_str());
            return "write";
        }
        const std::filesystem::directory_iterator entries(path, error);
        if (error) return name(error.value());
        return entries == std::filesystem::directory_iterator() ? "empty" : "read";
    }
    for (const auto& [flags, answer] : {std::pair{O_RDWR, "write"}, std::pair{O_RDONLY, "read"}}) {
        const int file = ::open(path.c_str(), flags | O_CLOEXEC);
        if (file < 0) continue;
        ::close(file);
        return answer;
    }
    return name(errno);
}

std::string writtenThrough(int descriptor) {
    std::string done;
    const auto attempt = [&done](const char* what, bool result) {
        if (result) done += std::string(what) + " ";
    };
    attempt("write", ::pwrite(descriptor, "x", 1, 0) == 1);
    attempt("truncate", ::ftruncate(descriptor, 0) == 0);
    void* const map = ::mmap(nullptr, 1, PROT_READ | PROT_WRITE, MAP_SHARED, descriptor, 0);
    attempt("map", map != MAP_FAILED);
    const std::string link = "/proc/self/fd/" + std::to_string(descriptor);
    attempt("reopen", ::open(link.c_str(), O_RDWR) >= 0);
    attempt("reopen-by-dev", ::open(("/dev/fd/" + std::to_string(descriptor)).c_str(), O_RDWR) >= 0);
    if (::fchmod(descriptor, 0666) == 0) attempt("reopen-after-mode", ::open(link.c_str(), O_RDWR) >= 0);
    attempt("link", ::linkat(AT_FDCWD, link.c_str(), AT_FDCWD, "/tmp/linked", AT_SYMLINK_FOLLOW) == 0);
    attempt("link-empty", ::linkat(descriptor, "", AT_FDCWD, "/tmp/linked", AT_EMPTY_PATH) == 0);
    attempt("truncate-by-name", ::truncate(link.c_str(), 0) == 0);
    return done;
}

}  // namespace lumacast::probe
