#include "linux/extensions/launcher/SystemCalls.h"

#include <fcntl.h>
#include <sched.h>
#include <seccomp.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <initializer_list>

namespace lumacast::launcher {

namespace {

/// Other processes, the kernel and its modules, mounts and namespaces, and what has been a way around a sandbox before.
constexpr const char* kAlwaysTaken[] = {
    // other processes
    "ptrace", "process_vm_readv", "process_vm_writev", "process_madvise", "process_mrelease", "kcmp", "pidfd_getfd",
    "move_pages", "migrate_pages", "lookup_dcookie",
    // mounts, roots, namespaces
    "mount", "umount", "umount2", "pivot_root", "chroot", "setns", "unshare", "move_mount", "open_tree", "fsopen",
    "fsconfig", "fsmount", "fspick", "mount_setattr", "open_by_handle_at", "name_to_handle_at", "statmount",
    "listmount",
    // the kernel and the machine
    "kexec_load", "kexec_file_load", "init_module", "finit_module", "delete_module", "create_module", "bpf",
    "perf_event_open", "userfaultfd", "reboot", "swapon", "swapoff", "acct", "syslog", "quotactl", "quotactl_fd",
    "settimeofday", "stime", "clock_settime", "clock_settime64", "clock_adjtime", "clock_adjtime64", "adjtimex",
    "sethostname", "setdomainname", "iopl", "ioperm", "modify_ldt", "vm86", "vm86old", "vhangup", "nfsservctl",
    "uselib", "sysfs", "_sysctl", "ustat", "fanotify_init", "fanotify_mark", "personality",
    // keys
    "keyctl", "add_key", "request_key",
    // rings, which do what other calls do without asking this filter
    "io_uring_setup", "io_uring_enter", "io_uring_register",
    // x32, i386 and others get no further, see below
};

/// Where nothing else does: objects that all processes of the user share, and what the file rules don't cover.
constexpr const char* kTakenWhenShared[] = {
    "shmget",          "shmat",
    "shmctl",          "semget",
    "semop",           "semtimedop",
    "semctl",          "msgget",
    "msgsnd",          "msgrcv",
    "msgctl",          "mq_open",
    "mq_unlink",       "mq_timedsend",
    "mq_timedreceive", "mq_notify",
    "pidfd_open",      "pidfd_send_signal",
    "rt_sigqueueinfo", "rt_tgsigqueueinfo",
    "tkill",           "setpriority",
    "ioprio_set",      "sched_setattr",
    "chmod",           "fchmod",
    "fchmodat",        "fchmodat2",
    "chown",           "fchown",
    "lchown",          "fchownat",
    "setxattr",        "lsetxattr",
    "fsetxattr",       "setxattrat",
    "removexattr",     "lremovexattr",
    "fremovexattr",    "removexattrat",
    "utime",           "utimes",
    "futimesat",       "utimensat",
    "file_setattr",    "fork",
    "vfork",           "setpgid",
    "setsid",
};

class Filter final {
public:
    Filter() : context_(seccomp_init(SCMP_ACT_ALLOW)) {
        // As the library would, but in so many words: a call of another architecture ends the process.
        if (!context_ || seccomp_attr_set(context_, SCMP_FLTATR_ACT_BADARCH, SCMP_ACT_KILL_PROCESS) != 0)
            error_ = ENOMEM;
    }
    Filter(const Filter&) = delete;
    Filter& operator=(const Filter&) = delete;
    ~Filter() {
        if (context_) seccomp_release(context_);
    }

    /// Fails the call, if this architecture has it, when all conditions hold.
    void take(const char* name, std::initializer_list<scmp_arg_cmp> when = {}, int with = EPERM) {
        const int number = seccomp_syscall_resolve_name(name);
        if (error_ != 0 || number == __NR_SCMP_ERROR) return;
        const int failed = seccomp_rule_add_array(context_, SCMP_ACT_ERRNO(static_cast<std::uint32_t>(with)), number,
                                                  static_cast<unsigned>(when.size()), when.begin());
        // A call that this architecture only knows by another number is none here.
        if (failed != 0 && failed != -EDOM && number >= 0) error_ = -failed;
    }
    int load() {
        if (error_ != 0) return error_;
        return -seccomp_load(context_);
    }

private:
    scmp_filter_ctx context_;
    int error_ = 0;
};

scmp_arg_cmp argument(unsigned index, scmp_compare how, std::uint64_t value, std::uint64_t second = 0) {
    return {index, how, value, second};
}

/// Only the lower half counts of arguments that the kernel takes as int.
scmp_arg_cmp has(unsigned index, std::uint64_t bits) {
    return argument(index, SCMP_CMP_MASKED_EQ, bits, bits);
}
scmp_arg_cmp isInt(unsigned index, std::uint32_t value) {
    return argument(index, SCMP_CMP_MASKED_EQ, 0xffffffffU, value);
}

void takeNamespaces(Filter& filter) {
    for (const std::uint64_t flag :
         {std::uint64_t{CLONE_NEWNS}, std::uint64_t{CLONE_NEWCGROUP}, std::uint64_t{CLONE_NEWUTS},
          std::uint64_t{CLONE_NEWIPC}, std::uint64_t{CLONE_NEWUSER}, std::uint64_t{CLONE_NEWPID},
          std::uint64_t{CLONE_NEWNET}})
        filter.take("clone", {has(0, flag)});
    // Its flags are in memory, which a filter can't read. Programs then use the older call.
    filter.take("clone3", {}, ENOSYS);
}

void takeSockets(Filter& filter, bool network) {
    if (!network) {
        filter.take("socket");
    } else {
        // Only the Internet's, and the questions about its routes. Above all no Unix sockets: with the network come the
        // abstract ones of every desktop service.
        filter.take("socket", {argument(0, SCMP_CMP_GT, AF_NETLINK)});
        for (int family = 0; family <= AF_NETLINK; ++family)
            if (family != AF_INET && family != AF_INET6 && family != AF_NETLINK)
                filter.take("socket", {isInt(0, static_cast<std::uint32_t>(family))});
        for (std::uint32_t protocol = 1; protocol < 32; ++protocol)
            filter.take("socket", {isInt(0, AF_NETLINK), isInt(2, protocol)});
        for (const std::uint32_t type : {std::uint32_t{SOCK_RAW}, std::uint32_t{SOCK_PACKET}})
            for (const std::uint32_t family : {std::uint32_t{AF_INET}, std::uint32_t{AF_INET6}})
                filter.take("socket", {isInt(0, family), argument(1, SCMP_CMP_MASKED_EQ, 0xf, type)});
    }
    // A pair is how an endpoint is reached. Not of datagrams: such a socket could be connected to another one.
    filter.take("socketpair", {argument(0, SCMP_CMP_NE, AF_UNIX)});
    filter.take("socketpair", {argument(1, SCMP_CMP_MASKED_EQ, 0xf, SOCK_DGRAM)});
    filter.take("socketpair", {argument(1, SCMP_CMP_MASKED_EQ, 0xf, SOCK_RAW)});
}

void takeTerminals(Filter& filter) {
    for (const std::uint32_t request : {std::uint32_t{TIOCSTI}, std::uint32_t{TIOCSCTTY}, 0x541cU /* TIOCLINUX */})
        filter.take("ioctl", {isInt(1, request)});
}

/// Signals to itself alone; no processes of its own, only threads; and it stays the child that its parent ends.
void keepAlone(Filter& filter) {
    const auto self = static_cast<std::uint32_t>(::getpid());
    for (const char* name : kTakenWhenShared) filter.take(name);
    filter.take("kill", {argument(0, SCMP_CMP_NE, self)});
    filter.take("tgkill", {argument(0, SCMP_CMP_NE, self)});
    filter.take("clone", {argument(0, SCMP_CMP_MASKED_EQ, CLONE_THREAD, 0)});
    filter.take("prctl", {isInt(0, PR_SET_PDEATHSIG)});
    for (const char* name : {"prlimit64", "sched_setaffinity", "sched_setscheduler", "sched_setparam"})
        filter.take(name, {argument(0, SCMP_CMP_NE, 0)});
    // A descriptor's owner gets a signal of the sender's choice.
    for (const std::uint32_t command : {std::uint32_t{F_SETOWN}, 15U /* F_SETOWN_EX */, 10U /* F_SETSIG */})
        filter.take("fcntl", {isInt(1, command)});
    for (const std::uint32_t request : {0x8901U /* FIOSETOWN */, 0x8902U /* SIOCSPGRP */})
        filter.take("ioctl", {isInt(1, request)});
    filter.take("truncate");
}

}  // namespace

int restrictCalls(const CallRules& rules) {
    if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return errno;
    Filter filter;
    for (const char* name : kAlwaysTaken) filter.take(name);
    takeNamespaces(filter);
    takeSockets(filter, rules.network);
    takeTerminals(filter);
    if (rules.surroundings == Surroundings::Shared) keepAlone(filter);
    return filter.load();
}

}  // namespace lumacast::launcher
