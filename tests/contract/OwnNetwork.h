#pragma once
// A network of a test's own, with nobody in it.

#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/if_ether.h>
#include <linux/seccomp.h>
#include <sched.h>
#include <stddef.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <fstream>
#include <functional>
#include <new>
#include <string>
#include <thread>
#include <vector>

#include "linux/ipc/Fd.h"
#include "linux/network/NetworkAddress.h"
#include "tests/sound/SoundProcess.h"

namespace lumacast::test {

/// Runs `action` in a process with an empty network of an ordinary user's; what the test is to know of it afterwards
/// has to be in shared memory. Whether it could be made.
inline bool inProcessWithOwnNetwork(const std::function<void()>& action) {
    const std::string user = "0 " + std::to_string(::geteuid()) + " 1\n",
                      group = "0 " + std::to_string(::getegid()) + " 1\n";
    std::fflush(nullptr);  // or the child writes it again
    const pid_t child = ::fork();
    if (child == 0) {
        if (::unshare(CLONE_NEWUSER | CLONE_NEWNET) != 0) ::_exit(2);
        std::ofstream("/proc/self/setgroups") << "deny";
        std::ofstream("/proc/self/uid_map") << user;
        std::ofstream("/proc/self/gid_map") << group;
        action();
        std::fflush(nullptr);
        ::_exit(::testing::Test::HasFailure() ? 1 : 0);
    }
    int status = 0;
    if (child < 0 || ::waitpid(child, &status, 0) != child) return false;
    if (WIFEXITED(status) && WEXITSTATUS(status) == 2) return false;
    EXPECT_EQ(status, 0) << "in the process with its own network";
    return true;
}

/// Runs `action` on a thread with an empty network, which only it and the threads and programs it starts have, and
/// which ends with it; for an ordinary user, in a process. False where neither can be made; then nothing ran.
inline bool withOwnNetwork(const std::function<void()>& action) {
    bool made = false;
    std::thread([&] {
        if (::unshare(CLONE_NEWNET) != 0) return;
        made = true;
        action();
    }).join();
    return made || inProcessWithOwnNetwork(action);
}

/// A value that a process made by withOwnNetwork can leave to the test.
template <class T>
class SharedWithProcesses final {
public:
    SharedWithProcesses()
        : value_(new (::mmap(nullptr, sizeof(T), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0)) T()) {}
    ~SharedWithProcesses() { ::munmap(value_, sizeof(T)); }
    SharedWithProcesses(const SharedWithProcesses&) = delete;
    SharedWithProcesses& operator=(const SharedWithProcesses&) = delete;
    T& operator*() const { return *value_; }

private:
    T* const value_;
};

/// `ip` with these arguments; whether it did it.
inline bool ip(const std::string& arguments) {
    return SoundProcess({"sh", "-c", "ip " + arguments + " && echo done"}).readLine() == "done";
}

/// A device "near" with an address, whose other end is "far": what is sent to near goes nowhere else.
inline bool makeDevice() {
    return ip("link add near type veth peer name far") && ip("link set near up") && ip("link set far up") &&
           ip("address add 10.77.0.1/24 dev near");
}

/// From here on this thread, and what it starts, gets no netlink socket, as in a sandbox that forbids them.
inline bool forbidNetlink() {
    const auto load = [](std::size_t offset) {
        return sock_filter BPF_STMT(BPF_LD | BPF_W | BPF_ABS, static_cast<std::uint32_t>(offset));
    };
    sock_filter code[] = {
        load(offsetof(seccomp_data, nr)),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_socket, 0, 3),
        load(offsetof(seccomp_data, args[0])),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, AF_NETLINK, 0, 1),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | EAFNOSUPPORT),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
    };
    sock_fprog program{sizeof code / sizeof code[0], code};
    return ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 && ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

/// Sees every packet of this network.
class PacketEar final {
public:
    PacketEar() : socket_(::socket(AF_PACKET, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, htons(ETH_P_ALL))) {}
    bool isListening() const { return static_cast<bool>(socket_); }

    /// How many packets there were since the last time that look for neighbours of the old kind or have `address` in
    /// them.
    int heardOf(const NetworkAddress& address) {
        int count = 0;
        char bytes[2048];
        sockaddr_storage from{};
        socklen_t length = sizeof from;
        ssize_t got = 0;
        while ((got = ::recvfrom(socket_.get(), bytes, sizeof bytes, 0, reinterpret_cast<sockaddr*>(&from), &length)) >
               0) {
            const std::string packet(bytes, static_cast<std::size_t>(got));
            const std::string sought(reinterpret_cast<const char*>(address.bytes.data()), address.length());
            // A question for a neighbour by ARP: hardware type Ethernet, protocol IPv4.
            if (packet.starts_with(std::string("\0\1\x08\0", 4)) || packet.find(sought) != std::string::npos) ++count;
            length = sizeof from;
        }
        return count;
    }

private:
    Fd socket_;
};

}  // namespace lumacast::test
