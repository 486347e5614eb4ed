#pragma once
// The process whose sound is tapped, and who counts as it.

#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>

#include "base/Identifiers.h"
#include "linux/audio/TapSelection.h"
#include "linux/system/HeldProcess.h"

namespace lumacast::sound {

/// The application that a process belongs to, or none. Called on the sound thread; may take a moment.
using ApplicationOf = std::function<std::optional<BundleIdentifier>(ProcessID pid)>;

/// One process, held so that its number can't become another's. Belongs to the sound thread once the tap has begun.
class TapOwner final {
public:
    /// Null for a process that does not run. `applicationOf` may be empty: then no other process counts.
    static std::shared_ptr<TapOwner> hold(ProcessID pid, ApplicationOf applicationOf);

    /// Whether what this client plays is the process's sound: its own, or that of a descendant of the same bundle
    /// identifier. What a client only says of itself must also fit the process that it names: same machine, same name
    /// of the program (the number may come from inside a container, where it is another process's).
    bool owns(const ListedClient& client, const ClientIdentity& identity);

    bool hasEnded() const { return process_.hasEnded(); }

private:
    TapOwner(HeldProcess process, ApplicationOf applicationOf)
        : process_(std::move(process)), applicationOf_(std::move(applicationOf)) {}
    bool isSameApplication(ProcessID pid);

    const HeldProcess process_;
    const ApplicationOf applicationOf_;
    /// Clients whose process was found to be of the same application: a disk that is slow later changes nothing.
    std::set<std::pair<std::uint32_t, ProcessID>> family_;
};

}  // namespace lumacast::sound
