#include "linux/display/X11DisplayCapture.h"

#include <utility>

namespace lumacast {
namespace {

// Sizes beyond this don't fit the display server's coordinates.
constexpr double kLargestSide = 16384;

bool canBeCaptured(const Size& size) {
    return size.width >= 1 && size.height >= 1 && size.width <= kLargestSide && size.height <= kLargestSide;
}

}  // namespace

X11DisplayCaptureSource::X11DisplayCaptureSource(Setup setup) : setup_(std::move(setup)) {}

X11DisplayCaptureSource::~X11DisplayCaptureSource() {
    control_->quit();
    if (lane_) lane_->quit();
}

void X11DisplayCaptureSource::setDelegate(std::weak_ptr<DisplayCaptureDelegate> delegate) {
    control_->setDelegate(std::move(delegate));
}

void X11DisplayCaptureSource::openGate() { control_->openGate(setup_.clock.captureClock()); }

void X11DisplayCaptureSource::closeGate(GateWait wait) {
    control_->closeGate(wait);
    const std::lock_guard lock(mutex_);
    if (lane_) lane_->wake();
}

void X11DisplayCaptureSource::start() {
    if (!control_->start()) return;
    if (!canBeCaptured(setup_.captureSize)) return fail(X11CaptureStatus::kNotSupported);
    const auto running = lane();
    if (!running) return fail(X11CaptureStatus::kNoThread);
    running->wake();
}

void X11DisplayCaptureSource::stop() {
    control_->stop();
    const std::lock_guard lock(mutex_);
    if (lane_) lane_->wake();
}

std::shared_ptr<x11::FrameLane> X11DisplayCaptureSource::lane() {
    const std::lock_guard lock(mutex_);
    if (lane_) return lane_;
    const auto keeper = setup_.keeper.lock();
    auto lane = std::make_shared<x11::FrameLane>(x11::FrameLaneSetup{
        setup_.display, static_cast<std::int32_t>(setup_.captureSize.width),
        static_cast<std::int32_t>(setup_.captureSize.height), setup_.minimumInterval, control_, setup_.selection,
        weak_from_this(), &setup_.scheduler});
    if (keeper && keeper->launch(lane)) lane_ = std::move(lane);
    return lane_;
}

void X11DisplayCaptureSource::fail(std::int32_t status) {
    control_->stop();
    setup_.scheduler.mainQueue().async([source = weak_from_this(), control = control_, run = control_->order().run,
                                        status] {
        const auto failed = source.lock();
        const auto delegate = control->delegateOfEnded(run);
        if (failed && delegate) delegate->screenCaptureControllerDidFailWithStatus(*failed, status);
    });
}

X11DisplayCapture::X11DisplayCapture(std::string display, Clock& clock, Scheduler& scheduler)
    : display_(std::move(display)), clock_(clock), scheduler_(scheduler) {}

std::shared_ptr<DisplayCaptureSource> X11DisplayCapture::makeSource(Size captureSize, MediaTime minimumInterval) {
    return std::make_shared<X11DisplayCaptureSource>(X11DisplayCaptureSource::Setup{
        display_, captureSize, minimumInterval, clock_, scheduler_, selection_, keeper_});
}

}  // namespace lumacast
