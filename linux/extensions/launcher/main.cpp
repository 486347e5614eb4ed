// lumacast-extension-launcher: confines itself, then becomes the program.
//   lumacast-extension-launcher [OPTION]... -- PROGRAM [ARGUMENT]...
// The options are done in this order, whatever their order in the command:
//   --parent PID         ends with this parent; ends at once when another process is the parent
//   --oom NUMBER         its badness when memory runs out
//   --limit NAME=VALUE   address-space, data, open-files, file-size, processes (bytes or a number, hard limits)
//   --session            a session of its own
//   --connected NUMBER   ends at once when the other end of this socket has gone
//   --no-rights          no capabilities, and none to come
//   --read PATH, --write PATH   opens nothing but these (see Landlock.h)
//   --calls namespaces|shared   a filter for system calls (see SystemCalls.h)
//   --no-network         of that filter
// Exit status 125 with a line on standard error when one of them can't be done.

#include <fcntl.h>
#include <linux/capability.h>
#include <linux/securebits.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "linux/extensions/launcher/Landlock.h"
#include "linux/extensions/launcher/SystemCalls.h"

namespace lumacast::launcher {

namespace {

constexpr int kFailed = 125;

struct Order {
    std::optional<pid_t> parent;
    std::optional<int> badness;
    std::vector<std::string> limits;
    bool dropsRights = false;
    bool ownSession = false;
    std::optional<int> connection;
    FileRules files;
    std::optional<CallRules> calls;
    bool network = true;
    std::vector<char*> program;
};

[[noreturn]] void fail(const char* what, int error) {
    std::fprintf(stderr, "the extension can't be confined: %s: %s\n", what, std::strerror(error));
    std::_Exit(kFailed);
}

std::optional<long long> wholeNumber(std::string_view text) {
    long long number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    return error == std::errc() && end == text.data() + text.size() ? std::optional(number) : std::nullopt;
}

std::optional<Order> orderFrom(std::vector<char*> words) {
    Order order;
    for (std::size_t i = 0; i < words.size(); ++i) {
        const std::string_view word = words[i];
        if (word == "--") {
            order.program.assign(words.begin() + static_cast<std::ptrdiff_t>(i) + 1, words.end());
            if (order.program.empty()) return std::nullopt;
            order.program.push_back(nullptr);
            if (order.calls) order.calls->network = order.network;
            return order;
        }
        if (word == "--no-rights") {
            order.dropsRights = true;
            continue;
        }
        if (word == "--session") {
            order.ownSession = true;
            continue;
        }
        if (word == "--no-network") {
            order.network = false;
            continue;
        }
        if (++i == words.size()) return std::nullopt;
        const std::string value = words[i];
        const auto number = wholeNumber(value);
        if (word == "--parent" && number)
            order.parent = static_cast<pid_t>(*number);
        else if (word == "--connected" && number)
            order.connection = static_cast<int>(*number);
        else if (word == "--oom" && number)
            order.badness = static_cast<int>(*number);
        else if (word == "--limit")
            order.limits.push_back(value);
        else if (word == "--read")
            order.files.readable.push_back(value);
        else if (word == "--write")
            order.files.writable.push_back(value);
        else if (word == "--calls" && value == "namespaces")
            order.calls.emplace(CallRules{Surroundings::Namespaces, true});
        else if (word == "--calls" && value == "shared")
            order.calls.emplace(CallRules{Surroundings::Shared, true});
        else
            return std::nullopt;
    }
    return std::nullopt;
}

void endWith(pid_t parent) {
    if (::prctl(PR_SET_PDEATHSIG, SIGKILL) != 0) fail("its end with the daemon", errno);
    if (::getppid() != parent) std::_Exit(kFailed);  // it has gone before it could be told
}

void endUnlessConnected(int connection) {
    pollfd other{connection, 0, 0};
    if (::poll(&other, 1, 0) < 0 || (other.revents & (POLLHUP | POLLERR | POLLNVAL)) != 0) std::_Exit(kFailed);
}

/// Best effort: a kernel that can't is no reason not to run.
void setBadness(int badness) {
    const int file = ::open("/proc/self/oom_score_adj", O_WRONLY | O_CLOEXEC);
    if (file < 0) return;
    const std::string text = std::to_string(badness);
    [[maybe_unused]] const ssize_t written = ::write(file, text.data(), text.size());
    ::close(file);
}

bool limit(const std::string& order) {
    const std::size_t equals = order.find('=');
    const auto value = wholeNumber(order.substr(equals == std::string::npos ? order.size() : equals + 1));
    if (equals == std::string::npos || !value || *value < 0) return false;
    const std::string name = order.substr(0, equals);
    std::optional<int> resource;
    if (name == "address-space") resource = RLIMIT_AS;
    if (name == "data") resource = RLIMIT_DATA;
    if (name == "open-files") resource = RLIMIT_NOFILE;
    if (name == "file-size") resource = RLIMIT_FSIZE;
    if (name == "processes") resource = RLIMIT_NPROC;
    if (!resource) return false;
#ifdef LC_SANITIZED  // a sanitizer maps far more than it uses
    if (*resource == RLIMIT_AS || *resource == RLIMIT_DATA) return true;
#endif
    rlimit now{};
    if (::getrlimit(static_cast<__rlimit_resource>(*resource), &now) != 0) return false;
    const auto wanted = std::min<rlim_t>(static_cast<rlim_t>(*value), now.rlim_max);
    const rlimit both{wanted, wanted};
    return ::setrlimit(static_cast<__rlimit_resource>(*resource), &both) == 0;
}

/// Whether there are none to drop: then a service's filter may forbid the call that would.
bool hasNoRights() {
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct rights[_LINUX_CAPABILITY_U32S_3]{};
    if (::syscall(SYS_capget, &header, rights) != 0) return false;
    for (const __user_cap_data_struct& word : rights)
        if (word.effective != 0 || word.permitted != 0 || word.inheritable != 0) return false;
    return true;
}

void dropRights() {
    for (int capability = 0; ::prctl(PR_CAPBSET_READ, capability, 0, 0, 0) >= 0; ++capability)
        ::prctl(PR_CAPBSET_DROP, capability, 0, 0, 0);  // who has no rights may not drop them from what is bound either
    ::prctl(PR_CAP_AMBIENT, PR_CAP_AMBIENT_CLEAR_ALL, 0, 0, 0);
    ::prctl(PR_SET_SECUREBITS, SECBIT_NOROOT | SECBIT_NOROOT_LOCKED | SECBIT_NO_SETUID_FIXUP |
                                   SECBIT_NO_SETUID_FIXUP_LOCKED | SECBIT_KEEP_CAPS_LOCKED);
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct none[_LINUX_CAPABILITY_U32S_3]{};
    if (::syscall(SYS_capset, &header, none) != 0 && !hasNoRights()) fail("its rights", errno);
    // Without new rights an executable can't bring any back, whatever the bits above came to.
    if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) fail("its rights", errno);
}

[[noreturn]] void become(const Order& order) {
    if (order.parent) endWith(*order.parent);
    if (order.badness) setBadness(*order.badness);
    const rlimit noCore{0, 0};
    ::setrlimit(RLIMIT_CORE, &noCore);
    for (const std::string& one : order.limits)
        if (!limit(one)) fail(one.c_str(), errno);
    if (order.ownSession && ::setsid() < 0) fail("its session", errno);
    if (order.connection) endUnlessConnected(*order.connection);
    if (order.dropsRights) dropRights();
    const bool hasFileRules = !order.files.readable.empty() || !order.files.writable.empty();
    if (hasFileRules && !restrictFiles(order.files)) fail("its files", errno);
    if (order.calls)
        if (const int error = restrictCalls(*order.calls); error != 0) fail("its system calls", error);
    ::execv(order.program.front(), order.program.data());
    fail(order.program.front(), errno);
}

}  // namespace

}  // namespace lumacast::launcher

int main(int count, char** words) {
    const auto order = lumacast::launcher::orderFrom(std::vector<char*>(words + 1, words + count));
    if (!order) {
        std::fprintf(stderr, "usage: lumacast-extension-launcher [OPTION]... -- PROGRAM [ARGUMENT]...\n");
        return lumacast::launcher::kFailed;
    }
    lumacast::launcher::become(*order);
}
