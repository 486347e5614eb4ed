#pragma once
#include <map>
#include <mutex>
#include <utility>

#include "platform/Scheduler.h"
#include "platform/StoreLookup.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// Products that the test puts in. A failing call ("StoreLookup.start") finds nothing. Thread-safe; outlives its
/// lookups.
class FakeStoreLookup final : public StoreLookup {
public:
    FakeStoreLookup(Scheduler& scheduler, FaultPlan& faults)
        : queue_(scheduler.serialQueue("store")), faults_(faults) {}

    void start(const StoreRequest& request, Handler handler) override {
        std::vector<StoreProduct> found;
        const bool fails = faults_.fails("StoreLookup.start");
        {
            const std::lock_guard lock(mutex_);
            requests_.push_back(request);
            if (!fails)
                for (const std::string& identifier : request.bundleIdentifiers)
                    if (const auto product = products_.find(identifier); product != products_.end())
                        found.push_back(product->second);
        }
        queue_->async([found = std::move(found), handler = std::move(handler)] { handler(found); });
    }

    void add(const std::string& bundleIdentifier, StoreProduct product) {
        const std::lock_guard lock(mutex_);
        products_.insert_or_assign(bundleIdentifier, std::move(product));
    }
    std::vector<StoreRequest> requests() const {
        const std::lock_guard lock(mutex_);
        return requests_;
    }

private:
    const std::shared_ptr<SerialQueue> queue_;
    FaultPlan& faults_;
    mutable std::mutex mutex_;
    std::map<std::string, StoreProduct> products_;
    std::vector<StoreRequest> requests_;
};

}  // namespace lumacast
