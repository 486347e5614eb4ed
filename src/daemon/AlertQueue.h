#pragma once
#include <memory>
#include <mutex>

#include "platform/Scheduler.h"

namespace lumacast {

/// `lumaAlertQueue` — the one queue of the process on which alerts are shown and waited for, made when it is first asked
/// for. Any lane.
class AlertQueue {
public:
    explicit AlertQueue(Scheduler& scheduler) : scheduler_(scheduler) {}

    SerialQueue& get() {
        std::call_once(once_, [this] { queue_ = scheduler_.serialQueue("com.lumacast.alertQueue"); });
        return *queue_;
    }

private:
    Scheduler& scheduler_;
    std::once_flag once_;
    std::shared_ptr<SerialQueue> queue_;
};

}  // namespace lumacast
