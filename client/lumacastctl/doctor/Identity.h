#pragma once
// Which application a process or a program counts as, and what the administrator allows it.

#include <optional>
#include <string>
#include <vector>

#include "base/Identifiers.h"
#include "client/lumacastctl/doctor/Finding.h"
#include "linux/apps/Entitlements.h"

namespace lumacast::ctl {

/// Whose identity is asked for.
struct IdentityQuestion {
    std::optional<ProcessID> pid = {};           ///< --pid
    std::optional<std::string> executable = {};  ///< --exe; used when there is no pid
    bool isExample = false;                      ///< nobody asked: the pid is that of whoever called this tool
};

struct IdentityFacts {
    IdentityQuestion question;
    std::optional<std::string> executable;  ///< with links resolved; none when there is no such process or program
    std::optional<std::string> bundlePath;  ///< a desktop entry, or a folder with a manifest
    std::optional<std::string> identifier;
    std::string name;  ///< in the user's language; may be empty
    std::vector<std::string> applicationDirectories;  ///< where desktop entries are looked for
};

struct EntitlementFacts {
    std::optional<Entitlements::Explanation> explanation;  ///< none when the question names no process
    std::vector<std::string> directories;                  ///< with the administrator's drop-ins
};

/// Asks as the daemon does; what the disk does not answer in time is missing.
IdentityFacts probeIdentity(LinuxBundles& bundles, const LinuxBundles::Options& options,
                            const IdentityQuestion& question);
EntitlementFacts probeEntitlements(LinuxBundles& bundles, std::vector<std::string> directories,
                                   const IdentityQuestion& question);

Findings checkIdentity(const IdentityFacts& facts);
Findings checkEntitlements(const EntitlementFacts& facts);

}  // namespace lumacast::ctl
