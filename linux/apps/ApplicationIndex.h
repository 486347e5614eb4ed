#pragma once
// Which applications are installed, and which program belongs to which of them.

#include <time.h>

#include <chrono>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace lumacast {

/// One installed application.
struct InstalledApplication {
    std::string identifier;
    std::string path;     ///< its desktop entry, or its folder
    std::string program;  ///< resolved; empty when its program is not known or not its own
};

/// An unchanging picture of what is installed.
class InstalledApplications {
public:
    /// Reads all `directories`, most important first: "*.desktop" files, at most four folders deep (the id of an entry
    /// in a folder joins their names by '-'), and application folders "*.app" with a manifest. At most 4096
    /// applications. Blocks as long as the disk does.
    static InstalledApplications read(const std::vector<std::string>& directories,
                                      const std::vector<std::string>& searchPath);

    const InstalledApplication* withIdentifier(const std::string& identifier) const;
    /// The application whose program this is. An entry that names it as X-Lumacast-Executable goes before one that
    /// starts it, earlier directories before later ones, then the order of the ids decides.
    const InstalledApplication* withProgram(const std::string& program) const;

    /// Whether a directory that was read has changed, or may have, since.
    bool isOutdated() const;
    std::chrono::steady_clock::time_point readAt() const { return readAt_; }

private:
    struct Directory {
        std::string path;
        timespec modified{};
        bool exists = false;
    };
    class Collector;

    std::map<std::string, InstalledApplication> applications_;
    std::map<std::string, std::string> programs_;  ///< program, identifier
    std::vector<Directory> directories_;
    std::chrono::steady_clock::time_point readAt_;
    bool racy_ = false;  ///< a directory changed so shortly before that a later change might bear the same stamp
};

}  // namespace lumacast
