#pragma once
// What the display clone shows: set on the request lane, read by the frame lanes.

#include <cstdint>
#include <memory>
#include <mutex>
#include <set>
#include <vector>

#include "linux/display/Wake.h"
#include "platform/DisplayCapture.h"

namespace lumacast::x11 {

/// The mode and the windows wanted, shared by everything that captures. Thread-safe.
class CloneSelection final {
public:
    struct Wanted {
        int mode = DisplayCloneControl::kOff;
        std::set<ContextID> contexts;
        std::uint64_t version = 0;  ///< another one after each change
    };

    Wanted wanted() const;
    std::uint64_t version() const;
    void setMode(int mode);
    void setContexts(const std::set<ContextID>& contexts);
    /// The window is gone: its identifier may soon name a stranger's.
    void forget(ContextID context);
    /// The display server is gone, and all windows with it.
    void forgetAll() { setContexts({}); }
    /// Signals `wake` at each change, as long as it lives.
    void watch(std::weak_ptr<Wake> wake);

private:
    void changed();

    mutable std::mutex mutex_;
    Wanted wanted_;
    std::vector<std::weak_ptr<Wake>> watchers_;
};

}  // namespace lumacast::x11
