#pragma once
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "linux/display/CaptureLane.h"

namespace lumacast::x11 {

/// Owns the threads of the capture lanes, so that a source can end on its own lane and the process still joins every
/// thread. Thread-safe.
class LaneKeeper final {
public:
    LaneKeeper() = default;
    /// Ends all lanes and joins them; never on a lane.
    ~LaneKeeper();
    LaneKeeper(const LaneKeeper&) = delete;
    LaneKeeper& operator=(const LaneKeeper&) = delete;

    /// Runs the lane on a thread of its own. False when there is none to be had.
    [[nodiscard]] bool launch(std::shared_ptr<CaptureLane> lane);

private:
    struct Entry {
        std::shared_ptr<CaptureLane> lane;
        std::thread thread;
    };
    std::mutex mutex_;
    std::vector<Entry> entries_;
};

}  // namespace lumacast::x11
