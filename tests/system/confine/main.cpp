// Runs a program as the service manager would run it for a unit: the program's restrictions come from the unit's file.
//   confine --unit FILE [--drop-in FILE] --instance NUMBER [--move FROM TO]... --program FILE
// It takes the administrator's rights. Who has none gets all but the user, the files, the devices and the host name; it
// says so. Ends with 64 when the unit asks for what this program doesn't know.

#include <grp.h>
#include <linux/keyctl.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>

#include "tests/system/confine/Confine.h"

namespace lumacast::test {
namespace {

void setLimit(ServiceSection& service, const std::string& name, decltype(RLIMIT_CORE) which) {
    if (!service.has(name)) return;
    rlim_t value = std::stoul(service.one(name));
    rlimit now{};
    if (::getrlimit(which, &now) == 0 && ::geteuid() != 0) value = std::min(value, now.rlim_max);
    const rlimit limit{value, value};
    if (::setrlimit(which, &limit) != 0) fail("can't set " + name);
}

void becomeUser(uid_t user) {
    if (::setgroups(0, nullptr) != 0 || ::setresgid(user, user, user) != 0 || ::setresuid(user, user, user) != 0)
        fail("can't become the user");
}

void dropCapabilities(ServiceSection& service) {
    if (!service.words("CapabilityBoundingSet").empty() || !service.words("AmbientCapabilities").empty())
        fail("knows no capabilities but none");
    if (!service.has("CapabilityBoundingSet") || ::geteuid() != 0) return;
    for (int capability = 0; ::prctl(PR_CAPBSET_READ, capability) >= 0; ++capability)
        ::prctl(PR_CAPBSET_DROP, capability);
}

/// What the service manager gives every service, the unit's own, and what the manager itself adds.
std::vector<std::string> environmentOf(ServiceSection& service) {
    std::vector<std::string> environment{"PATH=/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin", "LANG=C.UTF-8"};
    for (const std::string& word : service.words("Environment")) {
        const auto equals = word.find('=');
        std::string value = word.substr(equals + 1);
        const auto path = value.find('/');
        if (path != std::string::npos) value = value.substr(0, path) + service.moved(value.substr(path));
        environment.push_back(word.substr(0, equals + 1) + value);
    }
    for (const char* name : {"NOTIFY_SOCKET", "LISTEN_PID", "LISTEN_FDS", "LISTEN_FDNAMES"})
        if (const char* value = std::getenv(name)) environment.push_back(std::string(name) + "=" + value);
    return environment;
}

int run(ServiceSection& service, const std::string& program) {
    // What decides when and how it is started and ended: the test's business, or the service manager's.
    for (const char* name : {"Type", "ExecStart", "Slice", "EnvironmentFile", "Restart", "RestartPreventExitStatus",
                             "KillMode", "TimeoutStopSec", "StateDirectoryMode", "CacheDirectoryMode"})
        (void)service.all(name);
    const auto environment = environmentOf(service);
    std::vector<char*> variables;
    // Of two with the same name the last counts.
    for (auto word = environment.rbegin(); word != environment.rend(); ++word)
        variables.push_back(const_cast<char*>(word->c_str()));
    variables.push_back(nullptr);
    const bool isAdministrator = ::geteuid() == 0;
    if (isAdministrator)
        confineFiles(service);
    else
        for (const char* name : {"ProtectSystem", "ProtectHome", "ReadWritePaths", "StateDirectory", "CacheDirectory",
                                 "PrivateMounts", "DevicePolicy", "DeviceAllow", "ProtectProc", "ProcSubset",
                                 "ProtectKernelTunables", "ProtectControlGroups"})
            (void)service.all(name);
    setLimit(service, "LimitCORE", RLIMIT_CORE);
    setLimit(service, "LimitNOFILE", RLIMIT_NOFILE);
    ::umask(static_cast<mode_t>(std::stoul(service.one("UMask"), nullptr, 8)));
    if (service.one("KeyringMode") == "private") ::syscall(SYS_keyctl, KEYCTL_JOIN_SESSION_KEYRING, nullptr);
    dropCapabilities(service);
    const auto user = static_cast<uid_t>(std::stoul(service.one("User")));
    if (isAdministrator)
        becomeUser(user);
    else
        (void)!::write(2, "confine: without user, files, devices and host name\n", 52);
    // Without it a filter takes rights that are gone by now.
    if (!service.isOn("NoNewPrivileges")) fail("can't do without NoNewPrivileges=yes");
    ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
    char* arguments[] = {const_cast<char*>(program.c_str()), nullptr};
    confineSystemCalls(service);
    ::execve(program.c_str(), arguments, variables.data());
    fail("can't run " + program);
}

}  // namespace
}  // namespace lumacast::test

int main(int count, char** words) {
    using namespace lumacast::test;
    std::string instance, program;
    std::vector<std::string> files;
    std::vector<std::pair<std::string, std::string>> moved;
    for (int i = 1; i + 1 < count; i += 2) {
        const std::string option = words[i], value = words[i + 1];
        if (option == "--instance")
            instance = value;
        else if (option == "--program")
            program = value;
        else if (option == "--unit" || option == "--drop-in")
            files.push_back(value);
        else if (option == "--move" && i + 2 < count)
            moved.emplace_back(value, words[++i + 1]);
        else
            fail("doesn't know " + option);
    }
    ServiceSection service(instance, moved);
    for (const std::string& file : files) service.read(file);
    return run(service, program);
}
