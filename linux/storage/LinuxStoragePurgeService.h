#pragma once
#include <chrono>
#include <memory>

#include "platform/FileSystem.h"
#include "platform/Scheduler.h"
#include "platform/StoragePurgeService.h"

namespace lumacast {

/// Watches the free space of the temporary directory's file system. Linux tells nobody when a disk fills, so it is
/// asked for at a slow pace: a question costs one statvfs. Its lane is a serial queue of its own. Destroying the
/// service ends the watch; a callback that is running is not waited for.
class LinuxStoragePurgeService final : public StoragePurgeService {
public:
    /// How long it takes to find out that space is short. At 5 Mbit/s a recording writes 6 MB meanwhile.
    static constexpr std::chrono::seconds kPace{10};
    /// The first periodic call: a daemon that never lives for a whole day lets its files age out too.
    static constexpr std::chrono::minutes kFirstPeriodicCall{10};
    static constexpr std::chrono::hours kPeriod{24};

    /// Both outlive the service.
    LinuxStoragePurgeService(Scheduler& scheduler, FileSystem& fileSystem);

    void registerCallbacks(std::string service, StoragePurgeCallbacks callbacks) override;
    void requestPurge(std::int32_t urgency, std::function<void(std::optional<PurgeRecord>)> answer) override;
    void requestPurgeableSpace(std::function<void(std::optional<PurgeRecord>)> answer) override;

    /// The urgency that so little free space has; 0 for enough.
    static std::int32_t urgencyOf(std::uint64_t freeBytes);

private:
    class Watch;

    Scheduler& scheduler_;
    const std::shared_ptr<SerialQueue> lane_;
    const std::shared_ptr<Watch> watch_;
    std::unique_ptr<Timer> timer_;
};

}  // namespace lumacast
