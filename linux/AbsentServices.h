#pragma once
// Services of a device that this port has none of yet.

#include "platform/NetworkReachability.h"
#include "platform/Scheduler.h"
#include "platform/ScreenReader.h"
#include "platform/StoreLookup.h"
#include "platform/SystemSounds.h"

namespace lumacast {

class AbsentSystemSounds final : public SystemSounds {
public:
    void play(std::uint32_t) override {}
};

class AbsentScreenReader final : public ScreenReader {
public:
    bool isRunning() const override { return false; }
};

class AbsentNetworkReachability final : public NetworkReachability {
public:
    std::optional<std::uint32_t> flags(const std::string&) override { return std::nullopt; }
};

/// Finds nothing.
class AbsentStoreLookup final : public StoreLookup {
public:
    explicit AbsentStoreLookup(Scheduler& scheduler) : scheduler_(scheduler) {}
    void start(const StoreRequest&, Handler handler) override {
        scheduler_.globalQueue(QueuePriority::Background).async([handler = std::move(handler)] { handler({}); });
    }

private:
    Scheduler& scheduler_;
};

}  // namespace lumacast
