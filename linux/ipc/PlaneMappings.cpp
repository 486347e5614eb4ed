#include "linux/ipc/PlaneMappings.h"

#include <sys/mman.h>

#include <algorithm>

namespace lumacast {

std::shared_ptr<const PlaneMapping> PlaneMapping::make(int descriptor, std::size_t bytes) {
    void* const memory = mmap(nullptr, bytes, PROT_READ, MAP_SHARED, descriptor, 0);
    if (memory == MAP_FAILED) return nullptr;
    return std::shared_ptr<const PlaneMapping>(new PlaneMapping(memory, bytes));
}

PlaneMapping::~PlaneMapping() { munmap(memory_, size_); }

std::shared_ptr<const PlaneMapping> PlaneMappings::of(const Identity& identity, int descriptor, std::size_t bytes) {
    std::shared_ptr<const PlaneMapping> outdone;  // unmapped after the lock
    const std::lock_guard lock(mutex_);
    const auto found = std::find_if(known_.begin(), known_.end(), [&](const Known& known) {
        return known.identity == identity && known.mapping->bytes().size() == bytes;
    });
    if (found != known_.end()) {
        std::rotate(found, found + 1, known_.end());
        return known_.back().mapping;
    }
    auto mapping = PlaneMapping::make(descriptor, bytes);
    if (!mapping) return nullptr;
    if (known_.size() >= kKept) {
        outdone = std::move(known_.front().mapping);
        known_.erase(known_.begin());
    }
    known_.push_back({identity, mapping});
    return mapping;
}

}  // namespace lumacast
