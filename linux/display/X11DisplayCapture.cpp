#include "linux/display/X11DisplayCapture.h"

#include <utility>

#include "linux/display/FrameLane.h"
#include "linux/display/LaneCaptureSource.h"

namespace lumacast {

X11DisplayCapture::X11DisplayCapture(std::string display, Clock& clock, Scheduler& scheduler)
    : display_(std::move(display)), clock_(clock), scheduler_(scheduler) {}

std::shared_ptr<DisplayCaptureSource> X11DisplayCapture::makeSource(Size captureSize, MediaTime minimumInterval) {
    auto makeLane = [display = display_](x11::CaptureLaneSetup setup) {
        return std::make_shared<x11::FrameLane>(display, std::move(setup));
    };
    return std::make_shared<LaneCaptureSource>(LaneCaptureSource::Setup{
        captureSize, minimumInterval, clock_, scheduler_, selection_, keeper_, std::move(makeLane)});
}

}  // namespace lumacast
