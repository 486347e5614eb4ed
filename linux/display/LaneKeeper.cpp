#include "linux/display/LaneKeeper.h"

#include <algorithm>
#include <system_error>

#include "linux/ipc/QuietThread.h"

namespace lumacast::x11 {

LaneKeeper::~LaneKeeper() {
    for (Entry& entry : entries_) entry.lane->quit();
    for (Entry& entry : entries_) entry.thread.join();
}

bool LaneKeeper::launch(std::shared_ptr<CaptureLane> lane) {
    const std::lock_guard lock(mutex_);
    std::erase_if(entries_, [](Entry& entry) {
        const bool over = entry.lane->finished();
        if (over) entry.thread.join();
        return over;
    });
    try {
        entries_.push_back({lane, quietThread([lane] { lane->run(); })});
    } catch (const std::system_error&) {
        return false;
    }
    return true;
}

}  // namespace lumacast::x11
