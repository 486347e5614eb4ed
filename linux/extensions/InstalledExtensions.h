#pragma once
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "base/Log.h"
#include "linux/apps/Languages.h"
#include "linux/extensions/ExtensionManifest.h"

namespace lumacast {

/// One installed extension, as a look at the disk found it. Immutable; shared.
struct InstalledExtension {
    ExtensionManifest manifest;
    std::string folder;             ///< absolute
    std::string program;            ///< the absolute path of its executable, without links
    bool isAdministrators = false;  ///< its folder, manifest and program are the administrator's
    Dictionary attributes;
    Dictionary information;
};

/// The extensions in `<directory>/lumacast/extensions/<name>/` of each data directory.
///
/// Each look reads the directories again and every manifest whose file has changed (its inode, size or time): a look is
/// rare and costs a few system calls for each extension, so nothing has to be watched in between, and nothing that
/// changed can be missed. Blocks as long as the disk does; thread-safe.
class InstalledExtensions final {
public:
    /// `dataDirectories`: the most important first. The log is borrowed.
    InstalledExtensions(Log& log, std::vector<std::string> dataDirectories, std::vector<Locale> locales);

    /// All there are: in the order of the directories, then of their identifiers; of those with the same identifier the
    /// first. At most Limit::ExtensionsInstalled. Each that is malformed or not safe is passed over, with one line
    /// until it changes. The error number when a directory that is there can't be read.
    std::variant<std::vector<std::shared_ptr<const InstalledExtension>>, int> look();

private:
    struct Known {
        std::string executable;  ///< as its manifest says; empty when it says nothing good
        std::string stamp;
        std::shared_ptr<const InstalledExtension> extension;  ///< null: passed over
    };
    Known& known(const std::string& folder);
    /// Sets `executable` where there is a good manifest.
    std::variant<std::shared_ptr<const InstalledExtension>, std::string> read(const std::string& folder,
                                                                              std::string& executable) const;

    Log& log_;
    const std::vector<std::string> directories_;
    const std::vector<Locale> locales_;
    std::mutex mutex_;
    std::map<std::string, Known> known_;  ///< by folder
    bool saidTooMany_ = false;            ///< in the look before
};

/// Its icons as PNG files, best first: those that are regular files of at most 1 MiB and begin as PNG files do. Blocks
/// as long as the disk does.
std::vector<Data> readIcons(const InstalledExtension& extension);

}  // namespace lumacast
