#pragma once
// The thread of one synthetic capture source.

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

#include "headless/Show.h"
#include "headless/display/Painter.h"
#include "headless/display/PlaneMemory.h"
#include "linux/display/CaptureLane.h"
#include "linux/display/CloneSelection.h"
#include "linux/display/FrameOutlet.h"
#include "linux/display/FramePacer.h"
#include "linux/display/Turn.h"
#include "linux/display/Wake.h"
#include "linux/system/HeldProcess.h"

namespace lumacast::headless {

/// Draws and delivers the show's pictures while the control says so. Each is stamped with the moment at which it began,
/// so that a machine that is late by less than a second delivers all of them, with the stamps they should have; what is
/// later than that is dropped and counted.
class SyntheticLane final : public x11::CaptureLane {
public:
    SyntheticLane(const Show& show, x11::CaptureLaneSetup setup);

    void run() override;
    bool finished() const override { return finished_.load(std::memory_order_acquire); }
    void wake() override { wake_->signal(); }
    void quit() override;

private:
    using Order = x11::CaptureControl::Order;
    using Stamp = x11::CaptureControl::Stamp;
    struct Delivered {
        std::shared_ptr<SyntheticPicture> picture;
        MediaTime stamp;
        std::shared_ptr<CaptureClock> clock;
        std::uint32_t transformFlags = 0;
    };

    std::int64_t work(const Order& order);
    bool beginRun(const Order& order);
    bool followSelection(const Order& order);
    void makePainter();
    std::int64_t takePictures(const Order& order);
    MediaTime stampOf(const Order& order, std::int64_t picture) const;
    bool takePicture(const Order& order, std::int64_t picture);
    bool deliver(const Order& order, Delivered what, Stamp kind);
    void sleep(std::int64_t deadline);

    const Show show_;
    const x11::CaptureLaneSetup setup_;
    const std::shared_ptr<x11::Wake> wake_ = std::make_shared<x11::Wake>();
    std::atomic<bool> finished_{false};

    // Of the lane alone.
    std::uint64_t run_ = 0;
    x11::CloneSelection::Wanted wanted_;
    std::vector<HeldProcess> owners_;  ///< of the windows that are shown
    std::vector<std::uint32_t> colours_;    ///< of what is shown; empty: nothing is
    std::optional<Painter> painter_;
    x11::Turn turn_ = x11::Turn::None;
    std::unique_ptr<PlaneStore> planes_;
    x11::FramePacer pacer_;
    std::int64_t next_ = 0;       ///< the show's picture that is due next
    bool isFirst_ = true;         ///< of the run
    std::uint64_t pictures_ = 0;  ///< numbered so far
    x11::FrameOutlet outlet_;
    Delivered last_;
};

}  // namespace lumacast::headless
