#pragma once
#include <cstdint>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "base/Log.h"
#include "linux/extensions/InstalledExtensions.h"

namespace lumacast {

/// What keeps an extension's process within its bounds, the strictest first.
enum class Confinement {
    Bubblewrap,  ///< namespaces of its own, and the file and call rules where the kernel has them
    Landlock,    ///< file and call rules, among the user's other processes
    None,        ///< resource limits only: where the administrator has allowed it
};

/// What one process may use at most. 0: no limit.
struct ExtensionResources {
    std::uint64_t addressSpace = 4ULL << 30;
    std::uint64_t fileBytes = 4ULL << 30;
    std::uint64_t openFiles = 1024;
    std::uint64_t processes = 512;  ///< and threads; where it has a user namespace of its own
    std::uint64_t temporaryBytes = 256ULL << 20;
    int badness = 500;  ///< of 1000, when memory runs out
};

/// A program to be run.
struct ConfinedCommand {
    std::vector<std::string> arguments;    ///< the first is its path
    std::vector<std::string> environment;  ///< all of it, "NAME=value"
    Confinement confinement = Confinement::None;
};

/// Decides how extensions are confined, and with which command.
class Sandbox final {
public:
    struct Options {
        std::string launcher;    ///< lumacast-extension-launcher
        std::string bubblewrap;  ///< its path; empty: not there
        bool landlock = true;    ///< whether the kernel's is used
        /// Whether the administrator has allowed to run extensions without a sandbox. Asked when nothing else is left.
        std::function<bool()> isUnsandboxedAllowed;
        std::string ownDirectories;                ///< the folder that has each extension's own directory
        std::vector<std::string> forbidden;        ///< directories that no grant may touch
        std::vector<std::string> baseEnvironment;  ///< "NAME=value", for every extension
        /// The daemon's variable of that name, for those it is granted to.
        std::function<std::optional<std::string>(const std::string&)> variable;
        ExtensionResources resources;
    };
    Sandbox(Log& log, Options options);

    /// The command for this extension, its data directory made; none when it must not be launched, after a line that
    /// says why. The first call tries what works on this device, which takes some ten milliseconds; what works is
    /// remembered. Blocks as long as the disk does. Thread-safe.
    std::optional<ConfinedCommand> commandFor(const InstalledExtension& extension);

    /// The directory that is the extension's home.
    std::string dataDirectoryOf(const InstalledExtension& extension) const;

private:
    struct Places {
        std::string data;
        std::vector<std::string> writable;
    };
    std::optional<Confinement> confinement();
    bool works(Confinement confinement) const;
    std::optional<Places> placesFor(const InstalledExtension& extension) const;
    std::vector<std::string> startOptions() const;
    std::vector<std::string> insideBubblewrap(const std::string& folder, const Places& places, bool network,
                                              const std::vector<std::string>& program, bool isProbe) const;
    std::vector<std::string> withLandlock(const std::string& folder, const Places& places, bool network,
                                          const std::vector<std::string>& program) const;
    std::vector<std::string> environmentFor(const InstalledExtension& extension, const Places& places,
                                            Confinement confinement) const;
    void sayOnce(std::string_view line, bool isError);

    Log& log_;
    const Options options_;
    const bool hasLandlock_;
    std::mutex mutex_;
    std::optional<Confinement> found_;
    std::string said_;
};

/// Whether daemon.conf in one of these directories, the first that has the key, says `AllowUnsandboxedExtensions=true`:
/// a file that belongs to `owner` (the administrator) and that nobody else may write.
bool unsandboxedExtensionsAllowed(const std::vector<std::string>& systemDirectories, unsigned owner = 0);

}  // namespace lumacast
