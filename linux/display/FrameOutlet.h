#pragma once
// Where the pictures of one capture source go, and the news that there will be no more.

#include <cstdint>
#include <functional>
#include <memory>

#include "linux/display/CaptureControl.h"
#include "linux/display/CaptureLane.h"
#include "writer/media/SampleMaker.h"

namespace lumacast::x11 {

/// What a delegate is told of a source.
using Telling = std::function<void(DisplayCaptureDelegate&, DisplayCaptureSource&)>;

/// That capture has failed with this status.
Telling failure(std::int32_t status);

/// On the main queue: this run has ended. Nobody is told once the source has been started again, or is gone.
void tellOfEnd(std::uint64_t run, const std::shared_ptr<CaptureControl>& control,
               std::weak_ptr<DisplayCaptureSource> source, Scheduler& scheduler, Telling telling);

/// Delivers what a lane captures, by the control's leave and in the source's name. Belongs to the lane.
class FrameOutlet final {
public:
    using Order = CaptureControl::Order;
    enum class Outcome {
        Delivered,
        ToNobody,      ///< nobody is there to take pictures
        OrderChanged,  ///< the lane is to do something else by now
    };

    explicit FrameOutlet(const CaptureLaneSetup& setup) : setup_(setup) {}

    /// A picture of this stamp, which becomes the one that it was delivered with. Returns when the delegate does.
    Outcome deliver(const Order& order, std::shared_ptr<SharedPlane> picture, MediaTime& stamp,
                    CaptureControl::Stamp kind, std::uint32_t transformFlags);
    /// The run is over, and its delegate is told why, unless it was no longer wanted.
    void end(const Order& order, Telling telling);

private:
    const CaptureLaneSetup setup_;
    SampleMaker samples_;
};

}  // namespace lumacast::x11
