#include "linux/display/LaneCaptureSource.h"

#include <utility>

#include "linux/display/CaptureStatus.h"
#include "linux/display/FrameOutlet.h"

namespace lumacast {
namespace {

// Sizes beyond this don't fit a display server's coordinates.
constexpr double kLargestSide = 16384;

bool canBeCaptured(const Size& size) {
    return size.width >= 1 && size.height >= 1 && size.width <= kLargestSide && size.height <= kLargestSide;
}

}  // namespace

LaneCaptureSource::LaneCaptureSource(Setup setup) : setup_(std::move(setup)) {}

LaneCaptureSource::~LaneCaptureSource() {
    control_->quit();
    if (lane_) lane_->quit();
}

void LaneCaptureSource::setDelegate(std::weak_ptr<DisplayCaptureDelegate> delegate) {
    control_->setDelegate(std::move(delegate));
}

void LaneCaptureSource::openGate() {
    control_->openGate(setup_.clock.captureClock());
}

void LaneCaptureSource::closeGate(GateWait wait) {
    control_->closeGate(wait);
    const std::lock_guard lock(mutex_);
    if (lane_) lane_->wake();
}

void LaneCaptureSource::start() {
    if (!control_->start()) return;
    if (!canBeCaptured(setup_.captureSize)) return fail(CaptureStatus::kNotSupported);
    const auto running = lane();
    if (!running) return fail(CaptureStatus::kNoThread);
    running->wake();
}

void LaneCaptureSource::stop() {
    control_->stop();
    const std::lock_guard lock(mutex_);
    if (lane_) lane_->wake();
}

std::shared_ptr<x11::CaptureLane> LaneCaptureSource::lane() {
    const std::lock_guard lock(mutex_);
    if (lane_) return lane_;
    const auto keeper = setup_.keeper.lock();
    auto lane = setup_.makeLane({static_cast<std::int32_t>(setup_.captureSize.width),
                                 static_cast<std::int32_t>(setup_.captureSize.height), setup_.minimumInterval, control_,
                                 setup_.selection, weak_from_this(), &setup_.scheduler});
    if (keeper && keeper->launch(lane)) lane_ = std::move(lane);
    return lane_;
}

void LaneCaptureSource::fail(std::int32_t status) {
    control_->stop();
    x11::tellOfEnd(control_->order().run, control_, weak_from_this(), setup_.scheduler, x11::failure(status));
}

}  // namespace lumacast
