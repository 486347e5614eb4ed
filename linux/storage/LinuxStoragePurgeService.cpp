#include "linux/storage/LinuxStoragePurgeService.h"

#include <utility>

#include "base/Limits.h"
#include "linux/storage/LinuxFileSystem.h"

namespace lumacast {

/// What the lane's tasks need. Touched on the lane only.
class LinuxStoragePurgeService::Watch {
public:
    explicit Watch(FileSystem& fileSystem)
        : fileSystem_(fileSystem), directory_(fileSystem.root() + std::string(kDeviceTemporaryDirectory) + "/") {}

    void setCallbacks(StoragePurgeCallbacks callbacks) {
        callbacks_ = std::move(callbacks);
        urgency_ = 0;
    }
    std::optional<PurgeRecord> purge(std::int32_t urgency) const {
        return callbacks_.purge ? callbacks_.purge(urgency) : std::nullopt;
    }
    std::optional<PurgeRecord> purgeableSpace() const {
        return callbacks_.purgeableSpace ? std::optional(callbacks_.purgeableSpace()) : std::nullopt;
    }
    void look() {
        lookAtSpace();
        elapsed_ += kPace;
        if (elapsed_ < untilPeriodicCall_) return;
        elapsed_ = std::chrono::seconds(0);
        untilPeriodicCall_ = kPeriod;
        if (callbacks_.periodic) (void)callbacks_.periodic();
    }

private:
    void lookAtSpace() {
        const auto answer = fileSystem_.freeSize(directory_);
        const auto* freeBytes = std::get_if<std::uint64_t>(&answer);
        if (!freeBytes) return;  // the directory is not there yet, or the disk does not answer
        const std::int32_t before = std::exchange(urgency_, urgencyOf(*freeBytes));
        if (urgency_ > before)
            (void)purge(urgency_);
        else if (urgency_ == 0 && before > 0 && callbacks_.cancelPurge)
            (void)callbacks_.cancelPurge(before);
    }

    FileSystem& fileSystem_;
    const std::string directory_;
    StoragePurgeCallbacks callbacks_;
    std::int32_t urgency_ = 0;  ///< of the space at the last look
    std::chrono::seconds elapsed_{0};
    std::chrono::seconds untilPeriodicCall_{kFirstPeriodicCall};
};

LinuxStoragePurgeService::LinuxStoragePurgeService(Scheduler& scheduler, FileSystem& fileSystem)
    : scheduler_(scheduler),
      lane_(scheduler.serialQueue("storage purge")),
      watch_(std::make_shared<Watch>(fileSystem)) {}

void LinuxStoragePurgeService::registerCallbacks(std::string, StoragePurgeCallbacks callbacks) {
    lane_->async(
        [watch = watch_, callbacks = std::move(callbacks)]() mutable { watch->setCallbacks(std::move(callbacks)); });
    if (!timer_) timer_ = scheduler_.timer(lane_, kPace, [watch = watch_] { watch->look(); });
}

void LinuxStoragePurgeService::requestPurge(std::int32_t urgency,
                                            std::function<void(std::optional<PurgeRecord>)> answer) {
    lane_->async([watch = watch_, urgency, answer = std::move(answer)] { answer(watch->purge(urgency)); });
}

void LinuxStoragePurgeService::requestPurgeableSpace(std::function<void(std::optional<PurgeRecord>)> answer) {
    lane_->async([watch = watch_, answer = std::move(answer)] { answer(watch->purgeableSpace()); });
}

std::int32_t LinuxStoragePurgeService::urgencyOf(std::uint64_t freeBytes) {
    std::int32_t urgency = 0;
    for (const PurgeLevel& level : kPurgeLevels)
        if (freeBytes < level.freeBytesBelow) urgency = level.urgency;
    return urgency;
}

}  // namespace lumacast
