#pragma once
#include "base/Guarded.h"
#include "writer/media/MediaTime.h"

namespace lumacast {

/// The process's one owner of device capture (the `sharedManager` of the process). Thread-safe.
class LCCaptureManager {
public:
    /// When the current capture began on the capture clock: set from the first screen frame of a recording, invalid
    /// before and after.
    MediaTime captureStartTime() const { return captureStartTime_.get(); }
    void setCaptureStartTime(MediaTime time) { captureStartTime_.set(time); }

    /// `stopAllCapture` — returns the manager to its idle state.
    void stopAllCapture() { captureStartTime_.set(kInvalidMediaTime); }

private:
    Guarded<MediaTime> captureStartTime_{kInvalidMediaTime};
};

}  // namespace lumacast
