// What a unit says of system calls, as the filters that the service manager would make of it.

#include <fcntl.h>
#include <sched.h>
#include <seccomp.h>
#include <sys/mman.h>
#include <sys/shm.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <memory>

#include "tests/system/confine/Confine.h"

namespace lumacast::test {

namespace {

class Filter final {
public:
    explicit Filter(std::uint32_t otherwise) : filter_(seccomp_init(otherwise)) {
        if (!filter_) fail("no filter");
        seccomp_attr_set(filter_, SCMP_FLTATR_CTL_NNP, 0);
    }
    ~Filter() { seccomp_release(filter_); }
    Filter(const Filter&) = delete;
    Filter& operator=(const Filter&) = delete;

    template <class... Comparison>
    void add(std::uint32_t action, const char* call, Comparison... comparisons) {
        const int number = seccomp_syscall_resolve_name(call);
        if (number == __NR_SCMP_ERROR) return;  // an older or another machine's
        const int error = seccomp_rule_add(filter_, action, number, sizeof...(comparisons), comparisons...);
        if (error != 0 && error != -EEXIST && error != -EDOM) fail(std::string("no rule for ") + call);
    }
    void load() {
        if (seccomp_load(filter_) != 0) fail("the filter is not taken");
    }

private:
    scmp_filter_ctx filter_;
};

const std::uint32_t kRefused = SCMP_ACT_ERRNO(EPERM);

/// The calls of a word of SystemCallFilter=, groups taken apart by the service manager's own tool.
void collect(const std::string& word, std::set<std::string>& calls) {
    if (word[0] != '@') {
        calls.insert(word);
        return;
    }
    const std::unique_ptr<FILE, int (*)(FILE*)> tool(
        ::popen(("systemd-analyze --no-pager syscall-filter " + word).c_str(), "r"), &::pclose);
    char line[256];
    bool any = false;
    while (tool && std::fgets(line, sizeof line, tool.get())) {
        std::istringstream text(line);
        std::string name;
        if (line[0] != ' ' || !(text >> name) || name[0] == '#') continue;
        any = true;
        collect(name, calls);
    }
    if (!any) fail("nobody knows the calls of " + word);
}

void allowOnlyListed(ServiceSection& service, Filter& filter) {
    std::set<std::string> allowed;
    collect("@default", allowed);
    for (const auto& words : service.all("SystemCallFilter")) {
        bool forbids = false;
        for (std::string word : words) {
            if (word[0] == '~') forbids = true, word.erase(0, 1);
            std::set<std::string> calls;
            collect(word, calls);
            for (const std::string& call : calls)
                if (forbids)
                    allowed.erase(call);
                else
                    allowed.insert(call);
        }
    }
    // This program's own last step.
    for (const char* call : {"execve", "exit_group", "write"}) allowed.insert(call);
    for (const std::string& call : allowed) filter.add(SCMP_ACT_ALLOW, call.c_str());
}

/// SCMP_A0 and its like are designated initializers.
scmp_arg_cmp compare(unsigned argument, scmp_compare how, scmp_datum_t a, scmp_datum_t b = 0) {
    return {argument, how, a, b};
}

void forbidNamespaces(Filter& filter) {
    for (const unsigned kind :
         {CLONE_NEWNS, CLONE_NEWCGROUP, CLONE_NEWUTS, CLONE_NEWIPC, CLONE_NEWUSER, CLONE_NEWPID, CLONE_NEWNET})
        for (const char* call : {"clone", "unshare"})
            filter.add(kRefused, call, compare(0, SCMP_CMP_MASKED_EQ, kind, kind));
    filter.add(kRefused, "setns");
    filter.add(SCMP_ACT_ERRNO(ENOSYS), "clone3");
}

void forbidWritableCode(Filter& filter) {
    const scmp_datum_t both = PROT_WRITE | PROT_EXEC;
    filter.add(kRefused, "mmap", compare(2, SCMP_CMP_MASKED_EQ, both, both));
    for (const char* call : {"mprotect", "pkey_mprotect"})
        filter.add(kRefused, call, compare(2, SCMP_CMP_MASKED_EQ, PROT_EXEC, PROT_EXEC));
    filter.add(kRefused, "shmat", compare(2, SCMP_CMP_MASKED_EQ, SHM_EXEC, SHM_EXEC));
}

void forbidSetuidFiles(Filter& filter) {
    for (const scmp_datum_t bit : {S_ISUID, S_ISGID}) {
        for (const auto& [call, mode] : {std::pair("chmod", 1U),
                                         {"fchmod", 1U},
                                         {"fchmodat", 2U},
                                         {"mkdir", 1U},
                                         {"mkdirat", 2U},
                                         {"mknod", 1U},
                                         {"mknodat", 2U},
                                         {"creat", 1U}})
            filter.add(kRefused, call, compare(mode, SCMP_CMP_MASKED_EQ, bit, bit));
        filter.add(kRefused, "open", compare(1, SCMP_CMP_MASKED_EQ, O_CREAT, O_CREAT),
                   compare(2, SCMP_CMP_MASKED_EQ, bit, bit));
        filter.add(kRefused, "openat", compare(2, SCMP_CMP_MASKED_EQ, O_CREAT, O_CREAT),
                   compare(3, SCMP_CMP_MASKED_EQ, bit, bit));
    }
    filter.add(SCMP_ACT_ERRNO(ENOSYS), "openat2");  // its mode can't be looked at
}

void allowOnlyFamilies(ServiceSection& service, Filter& filter) {
    constexpr int kMost = 64;
    std::set<int> allowed;
    for (const std::string& name : service.words("RestrictAddressFamilies")) {
        if (name == "AF_UNIX")
            allowed.insert(AF_UNIX);
        else if (name == "AF_INET")
            allowed.insert(AF_INET);
        else if (name == "AF_INET6")
            allowed.insert(AF_INET6);
        else if (name == "AF_NETLINK")
            allowed.insert(AF_NETLINK);
        else
            fail("doesn't know the family " + name);
    }
    const std::uint32_t none = SCMP_ACT_ERRNO(EAFNOSUPPORT);
    for (int family = 0; family <= kMost; ++family)
        if (!allowed.contains(family))
            filter.add(none, "socket", compare(0, SCMP_CMP_EQ, static_cast<scmp_datum_t>(family)));
    filter.add(none, "socket", compare(0, SCMP_CMP_GT, kMost));
}

void forbidCalls(Filter& filter, const std::string& group) {
    std::set<std::string> calls;
    collect(group, calls);
    for (const std::string& call : calls) filter.add(kRefused, call.c_str());
}

}  // namespace

void confineSystemCalls(ServiceSection& service) {
    Filter forbidden(SCMP_ACT_ALLOW);
    if (service.isOn("RestrictNamespaces")) forbidNamespaces(forbidden);
    if (service.isOn("MemoryDenyWriteExecute")) forbidWritableCode(forbidden);
    if (service.isOn("RestrictSUIDSGID")) forbidSetuidFiles(forbidden);
    if (service.isOn("RestrictRealtime"))
        for (const scmp_datum_t policy : {SCHED_FIFO, SCHED_RR, 6 /* SCHED_DEADLINE */})
            forbidden.add(kRefused, "sched_setscheduler", compare(1, SCMP_CMP_EQ, policy));
    if (service.isOn("LockPersonality")) forbidden.add(kRefused, "personality", compare(0, SCMP_CMP_NE, 0));
    if (service.has("RestrictAddressFamilies")) allowOnlyFamilies(service, forbidden);
    if (service.isOn("ProtectKernelModules")) forbidCalls(forbidden, "@module");
    if (service.isOn("ProtectClock")) forbidCalls(forbidden, "@clock");
    if (service.isOn("ProtectKernelLogs")) forbidden.add(kRefused, "syslog");
    if (service.isOn("ProtectHostname"))
        for (const char* call : {"sethostname", "setdomainname"}) forbidden.add(kRefused, call);
    if (service.one("SystemCallArchitectures") != "native" && service.has("SystemCallArchitectures"))
        fail("knows native system calls only");  // the filters are, and end what makes others
    if (service.has("SystemCallErrorNumber") && service.one("SystemCallErrorNumber") != "EPERM")
        fail("knows EPERM only");
    Filter listed(kRefused);
    const bool lists = service.has("SystemCallFilter");
    if (lists) allowOnlyListed(service, listed);
    service.failOnWhatIsLeft();
    forbidden.load();
    if (lists) listed.load();
}

}  // namespace lumacast::test
