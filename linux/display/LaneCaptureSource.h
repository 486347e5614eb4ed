#pragma once
#include <functional>
#include <memory>
#include <mutex>

#include "linux/display/CaptureControl.h"
#include "linux/display/CaptureLane.h"
#include "linux/display/CloneSelection.h"
#include "linux/display/LaneKeeper.h"
#include "platform/Clock.h"
#include "platform/DisplayCapture.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// One capture source, whatever it captures: its lane, a thread, comes with the first start and goes with the source.
class LaneCaptureSource final : public DisplayCaptureSource, public std::enable_shared_from_this<LaneCaptureSource> {
public:
    using MakeLane = std::function<std::shared_ptr<x11::CaptureLane>(x11::CaptureLaneSetup setup)>;
    struct Setup {
        Size captureSize;
        MediaTime minimumInterval;
        Clock& clock;
        Scheduler& scheduler;
        std::shared_ptr<x11::CloneSelection> selection;
        std::weak_ptr<x11::LaneKeeper> keeper;
        MakeLane makeLane;
    };
    explicit LaneCaptureSource(Setup setup);
    ~LaneCaptureSource() override;

    void setDelegate(std::weak_ptr<DisplayCaptureDelegate> delegate) override;
    void openGate() override;
    void closeGate(GateWait wait) override;
    void start() override;
    void stop() override;
    Counters counters() const override { return control_->counters(); }

private:
    std::shared_ptr<x11::CaptureLane> lane();
    void fail(std::int32_t status);

    const Setup setup_;
    const std::shared_ptr<x11::CaptureControl> control_ = std::make_shared<x11::CaptureControl>();
    std::mutex mutex_;  // guards lane_
    std::shared_ptr<x11::CaptureLane> lane_;
};

}  // namespace lumacast
