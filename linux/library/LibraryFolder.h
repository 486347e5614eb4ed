#pragma once
#include <sys/types.h>

#include <string>
#include <variant>
#include <vector>

#include "linux/ipc/Fd.h"

namespace lumacast {

/// The library's folder, open for reading its names and for syncing. Made, with the Videos folder that holds it, where
/// they are missing; those that were made are removed again, if they are empty, unless it is kept. Of one thread at a
/// time; blocks as long as the disk does.
class LibraryFolder final {
public:
    /// Opens or makes `videos`/Lumacast with the calling thread's rights, which are `user`'s; or the error number:
    /// ENOENT when the folder that should hold `videos` is not there, EACCES for a link on the way, or a folder at its
    /// end, of somebody else's than `user` or the administrator.
    static std::variant<LibraryFolder, int> open(const std::string& videos, uid_t user);
    LibraryFolder(LibraryFolder&&) noexcept;
    LibraryFolder& operator=(LibraryFolder&&) = delete;
    ~LibraryFolder();

    int get() const { return folder_.get(); }
    const std::string& path() const { return path_; }

    /// Brings its names, and its own, to the disk. 0 or the error number.
    [[nodiscard]] int sync() const;
    /// What was made stays.
    void keep() { made_.clear(); }

private:
    struct Made {
        Fd parent;
        std::string name;
    };
    LibraryFolder() = default;
    std::variant<Fd, int> openOrMake(const std::string& path, uid_t user, bool isOurs);

    std::string path_;
    Fd folder_;
    std::vector<Made> made_;  ///< outermost first
};

}  // namespace lumacast
