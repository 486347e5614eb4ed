#include "linux/system/UserRights.h"

#include <grp.h>
#include <pwd.h>
#include <sys/fsuid.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>

#include "linux/system/Threads.h"

namespace lumacast {

namespace {

constexpr uid_t kNobodyAtAll = static_cast<uid_t>(-1);  // to the kernel: leave it as it is
constexpr std::size_t kMaximumEntryBytes = 1 << 20;
constexpr int kMaximumGroups = 65536;  // the kernel's NGROUPS_MAX

std::vector<gid_t> groupsOf(const passwd& entry) {
    std::vector<gid_t> groups(64);
    int count = static_cast<int>(groups.size());
    while (::getgrouplist(entry.pw_name, entry.pw_gid, groups.data(), &count) < 0) {
        if (count <= static_cast<int>(groups.size()) || count > kMaximumGroups) return {entry.pw_gid};
        groups.resize(static_cast<std::size_t>(count));
    }
    groups.resize(static_cast<std::size_t>(count));
    return groups;
}

}  // namespace

std::optional<UserAccount> systemAccount(uid_t user) {
    std::vector<char> text(4096);
    passwd entry{};
    passwd* found = nullptr;
    int error = 0;
    while ((error = ::getpwuid_r(user, &entry, text.data(), text.size(), &found)) == ERANGE) {
        if (text.size() >= kMaximumEntryBytes) return std::nullopt;
        text.resize(text.size() * 2);
    }
    if (error != 0 || !found) return std::nullopt;
    UserAccount account;
    account.user = entry.pw_uid;
    account.group = entry.pw_gid;
    account.groups = groupsOf(entry);
    if (entry.pw_dir) account.home = entry.pw_dir;
    return account;
}

bool canActFor(uid_t user) { return user != kNobodyAtAll && (user == ::geteuid() || ::geteuid() == 0); }

int becomeUser(const UserAccount& account) {
    if (account.user == kNobodyAtAll || account.group == static_cast<gid_t>(-1)) return EPERM;
    // The library's setgroups would change every thread of the process; the kernel's own call changes this one.
    if (::syscall(SYS_setgroups, account.groups.size(), account.groups.data()) != 0) return errno;
    ::setfsgid(account.group);
    ::setfsuid(account.user);  // leaving 0 also takes the administrator's powers over files away
    // These two have no other way to say that they failed.
    const bool done = static_cast<gid_t>(::setfsgid(static_cast<gid_t>(-1))) == account.group &&
                      static_cast<uid_t>(::setfsuid(kNobodyAtAll)) == account.user;
    return done ? 0 : EPERM;
}

int performAs(uid_t user, const AccountLookup& accounts, const std::function<int()>& action) {
    if (!canActFor(user)) return EPERM;
    if (user == ::geteuid()) return action();
    const auto account = accounts(user);
    if (!account) return EPERM;
    return performOnOwnThread([&] {
        const int refusal = becomeUser(*account);
        return refusal != 0 ? refusal : action();
    });
}

}  // namespace lumacast
