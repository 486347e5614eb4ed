#pragma once
// Every path and name the port takes from its environment, resolved once at the start.

#include <sys/types.h>

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/Value.h"

namespace lumacast {

/// An immutable picture of the process's environment. Only the XDG, language and service-manager variables count; a
/// relative path in an XDG variable is ignored, as the XDG Base Directory Specification wants it. No path ends in a
/// slash.
struct LinuxEnvironment {
    std::string home;
    std::string runtimeDirectory;  ///< $XDG_RUNTIME_DIR/lumacast (else /run/user/UID/lumacast): sockets; one user's
    std::string configHome;
    std::vector<std::string> configDirectories;  ///< configHome first, then $XDG_CONFIG_DIRS
    std::string dataHome;
    std::vector<std::string> dataDirectories;  ///< dataHome first, then $XDG_DATA_DIRS
    std::string stateDirectory;                ///< $XDG_STATE_HOME/lumacast: telemetry, and the root directory
    std::string cacheDirectory;                ///< $XDG_CACHE_HOME/lumacast
    std::vector<std::string>
        systemDirectories;  ///< the administrator's: /etc/lumacast, then lumacast in $XDG_CONFIG_DIRS

    /// What stands in front of every fixed path of the device: `Root=` of the administrator's daemon.conf, else
    /// $XDG_STATE_HOME/lumacast/root. `Root=/` makes it empty: the fixed paths as they are prescribed.
    std::string root;
    std::string executable;      ///< of this process; empty when unknown
    std::string resourceBundle;  ///< the folder Lumacast.bundle; where it would be installed when it was not found
    std::vector<std::string> searchPath;  ///< $PATH

    std::string languageList;  ///< $LANGUAGE
    std::string messageLocale;  ///< the first of $LC_ALL, $LC_MESSAGES, $LANG that is not empty
    std::string notifySocket;   ///< $NOTIFY_SOCKET
    std::string journalStream;  ///< $JOURNAL_STREAM

    /// Answers a variable's value or none.
    using Variables = std::function<std::optional<std::string>(std::string_view name)>;

    /// The environment of this process. Reads the environment variables and the administrator's daemon.conf once; to be
    /// called before other threads run.
    static LinuxEnvironment ofThisProcess();
    /// The same from given variables; `systemDirectory` stands for /etc/lumacast.
    static LinuxEnvironment from(const Variables& variables, uid_t user, std::string executable,
                                 const std::string& systemDirectory = "/etc/lumacast");

    /// A directory that can't be had.
    struct BadDirectory {
        std::string path;
        std::string why;  ///< the system's own words, or that it is somebody else's
    };
    /// Makes the runtime, state and cache directories, for this user alone (mode 0700). The first that could not be
    /// made, or is not this user's own. Blocks as long as the disk does.
    [[nodiscard]] std::optional<BadDirectory> prepareDirectories() const;

    /// `name` below each of `directories`, in their order.
    static std::vector<std::string> below(const std::vector<std::string>& directories, std::string_view name);
};

/// Makes `path` and the parents it lacks, mode 0700 each. The first failure's error. Blocks as long as the disk does.
[[nodiscard]] std::optional<Error> makeDirectories(const std::string& path);

}  // namespace lumacast
