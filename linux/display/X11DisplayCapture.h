#pragma once
// The display capture roles on an X11 server.

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>

#include "linux/display/CaptureControl.h"
#include "linux/display/CloneSelection.h"
#include "linux/display/LaneKeeper.h"
#include "platform/Clock.h"
#include "platform/DisplayCapture.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// What a capture source reports when it fails.
struct X11CaptureStatus {
    static constexpr std::int32_t kNoDisplay = -1;      ///< no display server, or not on this machine
    static constexpr std::int32_t kNotSupported = -2;   ///< the server lacks an extension, or a size no frame can have
    static constexpr std::int32_t kWindowGone = -3;     ///< none of the wanted windows exists (any more)
    static constexpr std::int32_t kDisplayLost = -4;    ///< the display server has gone while capturing
    static constexpr std::int32_t kNoThread = -5;       ///< the system has no thread to capture on
};

/// One capture source: its lane, a thread, comes with the first start and goes with the source.
class X11DisplayCaptureSource final : public DisplayCaptureSource,
                                      public std::enable_shared_from_this<X11DisplayCaptureSource> {
public:
    struct Setup {
        std::string display;
        Size captureSize;
        MediaTime minimumInterval;
        Clock& clock;
        Scheduler& scheduler;
        std::shared_ptr<x11::CloneSelection> selection;
        std::weak_ptr<x11::LaneKeeper> keeper;
    };
    explicit X11DisplayCaptureSource(Setup setup);
    ~X11DisplayCaptureSource() override;

    void setDelegate(std::weak_ptr<DisplayCaptureDelegate> delegate) override;
    void openGate() override;
    void closeGate(GateWait wait) override;
    void start() override;
    void stop() override;
    Counters counters() const override { return control_->counters(); }

private:
    std::shared_ptr<x11::FrameLane> lane();
    void fail(std::int32_t status);

    const Setup setup_;
    const std::shared_ptr<x11::CaptureControl> control_ = std::make_shared<x11::CaptureControl>();
    std::mutex mutex_;  // guards lane_
    std::shared_ptr<x11::FrameLane> lane_;
};

/// Makes sources and chooses what they show. Outlives its sources' last start; its end joins their lanes and must not
/// come on one.
class X11DisplayCapture final : public DisplayCapture, public DisplayCloneControl {
public:
    /// `display` as in $DISPLAY; it need not exist yet. Clock and scheduler are borrowed.
    X11DisplayCapture(std::string display, Clock& clock, Scheduler& scheduler);

    std::shared_ptr<DisplayCaptureSource> makeSource(Size captureSize, MediaTime minimumInterval) override;
    void setMirroringMode(int mode) override { selection_->setMode(mode); }
    void setContexts(const std::set<ContextID>& contexts) override { selection_->setContexts(contexts); }

private:
    const std::string display_;
    Clock& clock_;
    Scheduler& scheduler_;
    const std::shared_ptr<x11::CloneSelection> selection_ = std::make_shared<x11::CloneSelection>();
    const std::shared_ptr<x11::LaneKeeper> keeper_ = std::make_shared<x11::LaneKeeper>();
};

}  // namespace lumacast
