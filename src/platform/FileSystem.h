#pragma once
// The file system as the temporary file store needs it.

#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "base/Date.h"
#include "base/Identifiers.h"
#include "base/Value.h"

namespace lumacast {

struct FileAttributes {
    std::uint64_t size = 0;
    Date modified;
    std::optional<Date> created;
    bool isDirectory = false;
};

/// An answer or the error that came instead. Error codes are the system's error numbers: ENOENT is what is not there
/// (ENOTDIR where a file stands on the way to it), ETIMEDOUT a disk that has not answered.
template <class T>
using Result = std::variant<T, Error>;

/// Paths are absolute; a doubled slash counts as one. Names are resolved beneath the temporary directory: a path that
/// would leave it through ".." or a link, or whose file name holds a slash, is refused. Asks the disk on a thread of
/// its own: what the disk has not answered within 40 ms counts as unreadable, so no call blocks longer (list, remove
/// and move wait for the disk: they run on background lanes only). A file that is being written answers with the bytes
/// its writer has written. Callable from any lane.
class FileSystem {
public:
    virtual ~FileSystem() = default;

    /// The configured root directory in front of every fixed path of the device, without a slash at its end; empty for
    /// none.
    virtual std::string root() const = 0;

    /// False also when the disk has not answered. Who has to tell that from nothing being there asks for the
    /// attributes, or removes.
    virtual bool exists(const std::string& path) = 0;
    /// Creates one directory, not its parents, with default attributes.
    virtual std::optional<Error> createDirectory(const std::string& path) = 0;
    virtual Result<FileAttributes> attributes(const std::string& path) = 0;
    /// The names in a directory, without "." and "..", in the file system's order.
    virtual Result<std::vector<std::string>> list(const std::string& directory) = 0;
    /// Removes a file, or a directory with what it holds.
    virtual std::optional<Error> remove(const std::string& path) = 0;
    /// Whose files this process makes.
    virtual UserID user() const = 0;
    /// Whether this user may itself read and remove the regular file at `path`, wherever it is; no link on the way is
    /// followed that is not the user's own or the administrator's. False for what lies in the temporary directory,
    /// under whatever name: that is this process's. False too when the disk has not answered.
    virtual bool userMayReadAndRemove(UserID user, const std::string& path) = 0;
    /// Removes a file, wherever it is, with that user's rights and as remove() does. EPERM where this process can't act
    /// for the user.
    virtual std::optional<Error> removeForUser(UserID user, const std::string& path) = 0;
    virtual std::optional<Error> move(const std::string& from, const std::string& to) = 0;
    /// Bytes available to this process on the file system that holds `path`.
    virtual Result<std::uint64_t> freeSize(const std::string& path) = 0;
};

}  // namespace lumacast
