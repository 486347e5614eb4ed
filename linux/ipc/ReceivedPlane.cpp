#include "linux/ipc/ReceivedPlane.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>

#include <utility>

namespace lumacast {

std::shared_ptr<ReceivedPlane> ReceivedPlane::make(Fd memory, PlaneRecord record, std::weak_ptr<PlaneLender> lender) {
    struct stat status {};
    const int seals = fcntl(memory.get(), F_GET_SEALS);
    if (seals < 0 || !(seals & F_SEAL_SHRINK) || fstat(memory.get(), &status) != 0) return nullptr;
    if (record.stride * static_cast<std::uint64_t>(record.height) > static_cast<std::uint64_t>(status.st_size))
        return nullptr;
    return std::make_shared<ReceivedPlane>(std::move(memory), std::move(record), std::move(lender));
}

ReceivedPlane::ReceivedPlane(Fd memory, PlaneRecord record, std::weak_ptr<PlaneLender> lender)
    : memory_(std::move(memory)), record_(std::move(record)), lender_(std::move(lender)) {}

ReceivedPlane::~ReceivedPlane() {
    if (mapping_) munmap(mapping_, bytes());
    if (const auto lender = lender_.lock()) lender->giveBack(record_.lease);
}

std::span<const std::uint8_t> ReceivedPlane::pixels() const {
    const std::lock_guard lock(mutex_);
    if (!mapping_) {
        void* mapping = mmap(nullptr, bytes(), PROT_READ, MAP_SHARED, memory_.get(), 0);
        if (mapping == MAP_FAILED) return {};
        mapping_ = mapping;
    }
    return {static_cast<const std::uint8_t*>(mapping_), bytes()};
}

}  // namespace lumacast
