#pragma once
// What applications are allowed beyond the ordinary, as the administrator says.

#include <sys/types.h>

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/Identifiers.h"
#include "base/Value.h"
#include "linux/apps/LinuxBundles.h"
#include "linux/system/DiskLane.h"

namespace lumacast {

/// Entitlements from the administrator's drop-ins: INI files `*.conf` with a section per bundle identifier,
///
///     [org.example.Player]
///     com.orvane.private.luma-cast=true
///
/// read in the order of their names, a later one deciding over an earlier one. They count only for a process whose
/// executable *and* whose desktop entry or manifest are the administrator's and writable by nobody else, and so are all
/// folders above them: otherwise anybody could give an own program the identifier of an entitled one. Drop-ins that
/// others could have written don't count either. Callable from any lane; what the disk has not answered in time is no
/// entitlement (`value` waits for the patience once).
///
/// What it can't tell: a user may still load code into an entitled program that permits it (a debugger, a preload).
class Entitlements final {
public:
    struct Options {
        std::vector<std::string> directories;  ///< with the drop-ins; a later directory decides over an earlier one
        uid_t administrator = 0;
        std::chrono::milliseconds patience{100};
    };
    /// `bundles` tells which application a process is; borrowed.
    Entitlements(Bundles& bundles, Options options);

    /// The value of entitlement `name` of a process, or none.
    std::optional<Value> value(ProcessID pid, std::string_view name);

    /// How an answer came about, for people: one finding a line, and what the drop-ins say if all is well. Waits for
    /// the patience a few times.
    struct Explanation {
        std::optional<BundleIdentifier> application;
        std::vector<std::string> findings;
        bool counts = false;  ///< whether drop-ins count for this process at all
        Dictionary entitlements;
    };
    Explanation explain(ProcessID pid);

    /// `entitlements.d` below each of the administrator's directories, the most important last.
    static std::vector<std::string> directoriesFrom(const LinuxEnvironment& environment);

private:
    Bundles& bundles_;
    const Options options_;
    DiskLane disk_{2};
    DiskLane questions_{2};  ///< waits for all the looks of one question together; last, so that it ends first
};

/// Why a file or a folder can't be trusted to be the administrator's own: it, or a folder above it, belongs to somebody
/// else or may be written to by others (a folder where only owners may rename, like /tmp, is fine above it). None when
/// it can. Links are resolved first. Blocks as long as the disk does.
std::optional<std::string> whyNotAdministratorOwned(const std::string& path, uid_t administrator);

}  // namespace lumacast
