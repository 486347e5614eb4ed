#pragma once
// What the daemon does for a user with that user's rights.

#include <sys/types.h>

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace lumacast {

/// A user's account on this machine.
struct UserAccount {
    uid_t user = 0;
    gid_t group = 0;
    std::vector<gid_t> groups;
    std::string home;
};

/// How an account is found; tests have accounts of their own.
using AccountLookup = std::function<std::optional<UserAccount>(uid_t user)>;

/// The account in this machine's database; none for an unknown user. Blocks as long as the database does.
std::optional<UserAccount> systemAccount(uid_t user);

/// Whether this process has the rights to act for `user` at all: it is that user, or the administrator.
bool canActFor(uid_t user);

/// Gives the calling thread, and no other, that user's rights on files for good: user, group and groups, and none of
/// the administrator's powers over files. So only for a thread that ends after it. 0, or the error number (EPERM where
/// the kernel does not let it); then nothing may be done on the thread for the user.
[[nodiscard]] int becomeUser(const UserAccount& account);

/// Runs `action` with a user's rights on files and answers its error number (0 for none): on this thread where the
/// process is that user, else on a thread of its own, which is waited for. EPERM where this process can't act for the
/// user or does not know him. `action` must not throw. Blocks as long as the account database and `action` do.
[[nodiscard]] int performAs(uid_t user, const AccountLookup& accounts, const std::function<int()>& action);

}  // namespace lumacast
