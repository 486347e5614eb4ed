#pragma once
// Giving storage back when the device runs short of it.

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace lumacast {

/// What came of a purge, or could come of one.
struct PurgeRecord {
    std::uint64_t bytes = 0;
    friend bool operator==(const PurgeRecord&, const PurgeRecord&) = default;
};

/// What the service asks of who has registered: in this order. Called one at a time on the service's own lane, never on
/// the main queue. They may wait for the disk, and for what they submit to the main queue.
struct StoragePurgeCallbacks {
    /// How much could be given back.
    std::function<PurgeRecord()> purgeableSpace;
    /// Space is short; the higher the urgency (1 and up), the shorter. Answers what was given back, none for nothing.
    std::function<std::optional<PurgeRecord>(std::int32_t urgency)> purge;
    /// The shortage that a purge was asked for with this urgency is over. Answers its argument.
    std::function<std::int32_t(std::int32_t urgency)> cancelPurge;
    /// Once a day, whatever the space.
    std::function<PurgeRecord()> periodic;
};

/// Watches the free space of the temporary directory's file system, keeps the day, and takes the administrator's
/// requests. When less space is free than one of the levels in base/Limits.h says, the purge callback is called with
/// that urgency: once, until the space has got better or a more urgent level is reached. Space that can't be read
/// changes nothing. Callable from any lane; nothing here waits.
class StoragePurgeService {
public:
    virtual ~StoragePurgeService() = default;

    /// Registers under the name of a service, in place of an earlier registration, and begins to watch. What the
    /// callbacks hold is held until the service ends or another registration takes their place.
    virtual void registerCallbacks(std::string service, StoragePurgeCallbacks callbacks) = 0;

    /// The administrator asks for a purge. `answer` is called on the service's lane when it has ended: none when
    /// nothing was given back, and when nobody has registered.
    virtual void requestPurge(std::int32_t urgency, std::function<void(std::optional<PurgeRecord>)> answer) = 0;
    /// The administrator asks what could be given back; answered likewise, none when nobody has registered.
    virtual void requestPurgeableSpace(std::function<void(std::optional<PurgeRecord>)> answer) = 0;
};

}  // namespace lumacast
