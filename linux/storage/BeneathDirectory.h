#pragma once
// Names resolved beneath one directory, and a user's own names.

#include <sys/types.h>

#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "linux/ipc/Fd.h"

namespace lumacast {

/// How paths are resolved: by the kernel (openat2, Linux 5.6), or component by component where it does not have that or
/// a sandbox forbids it. Both answer alike.
enum class Resolution { Kernel, Walk };

/// What the running kernel offers. Tried by a call, not read from a version.
Resolution availableResolution();

/// A name in an open directory. The name is a single component, never "." or "..".
struct ResolvedName {
    Fd directory;  ///< O_PATH
    std::string name;
};

/// Finds the place of `path` beneath `base` without ever leaving it: "." and ".." are refused, and so is every link on
/// the way. The last component is not looked at; what is done with it must not follow links either. Both paths are
/// absolute, doubled slashes count as one. `base` itself is reached as openTrusted does (an administrator may have linked
/// it elsewhere), and answers as its name in the folder that holds it.
///
/// Answers the error number instead: EACCES for a path outside `base` or with "." or "..", ELOOP or ENOTDIR for a link
/// on the way, else what the system says. Blocks as long as the disk does.
std::variant<ResolvedName, int> resolveBeneath(const std::string& base, const std::string& path, Resolution resolution);

/// Opens a directory (O_PATH) by its absolute path. Links on the way and at its end are followed if this user or the
/// administrator made them; one that somebody else planted, and a directory of somebody else's at the end, are EACCES.
/// Blocks as long as the disk does.
std::variant<Fd, int> openTrusted(const std::string& directory);
/// The same for another user than this process's.
std::variant<Fd, int> openTrusted(const std::string& directory, uid_t user);
/// The same for a directory at the end that may be anybody's: what may be done in it, its rights say.
std::variant<Fd, int> openFolder(const std::string& directory, uid_t user);

/// Finds the place of any absolute path, its folder reached as openFolder does, with the rights of the calling thread.
/// The last component is not looked at; what is done with it must not follow links either. EINVAL for a path that names
/// no file. Blocks as long as the disk does.
std::variant<ResolvedName, int> resolveForUser(const std::string& path, uid_t user);

/// `path` with every run of slashes as one and none at its end.
std::string withSingleSlashes(std::string_view path);

/// Removes `name` in `directory`; a directory with all that it holds. Links are removed, not followed. Answers 0 or the
/// error number; directories nested deeper than 64 levels answer ELOOP. Blocks as long as the disk does.
int removeTree(int directory, const std::string& name);

}  // namespace lumacast
