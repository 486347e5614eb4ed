#include "linux/ipc/ReceivedPlane.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <utility>

namespace lumacast {

std::shared_ptr<ReceivedPlane> ReceivedPlane::make(Fd memory, PlaneRecord record, std::weak_ptr<PlaneLender> lender) {
    struct stat status {};
    const int seals = fcntl(memory.get(), F_GET_SEALS);
    if (seals < 0 || !(seals & F_SEAL_SHRINK) || fstat(memory.get(), &status) != 0) return nullptr;
    if (record.stride * static_cast<std::uint64_t>(record.height) > static_cast<std::uint64_t>(status.st_size))
        return nullptr;
    return std::make_shared<ReceivedPlane>(std::move(memory), PlaneMappings::Identity{status.st_dev, status.st_ino},
                                           std::move(record), std::move(lender));
}

ReceivedPlane::ReceivedPlane(Fd memory, PlaneMappings::Identity identity, PlaneRecord record,
                             std::weak_ptr<PlaneLender> lender)
    : memory_(std::move(memory)), identity_(identity), record_(std::move(record)), lender_(std::move(lender)) {}

ReceivedPlane::~ReceivedPlane() {
    if (const auto lender = lender_.lock()) lender->giveBack(record_.lease);
}

std::span<const std::uint8_t> ReceivedPlane::pixels() const {
    const std::lock_guard lock(mutex_);
    if (!mapping_) {
        const auto lender = lender_.lock();
        mapping_ = lender ? lender->mappings().of(identity_, memory_.get(), bytes())
                          : PlaneMapping::make(memory_.get(), bytes());
    }
    return mapping_ ? mapping_->bytes() : std::span<const std::uint8_t>();
}

}  // namespace lumacast
