#include "linux/display/X11DisplayCapture.h"

#include <utility>

#include "linux/display/FrameLane.h"
#include "linux/display/LaneCaptureSource.h"

namespace lumacast {

X11DisplayCapture::X11DisplayCapture(std::string display, Clock& clock, Scheduler& scheduler)
    : display_(std::move(display)), clock_(clock), scheduler_(scheduler) {}

std::shared_ptr<DisplayCaptureSource> X11DisplayCapture::makeSource(Size captureSize, MediaTime minimumInterval) {
    auto makeLane = [display = display_, captureSize, minimumInterval, selection = selection_, scheduler = &scheduler_](
                        std::weak_ptr<DisplayCaptureSource> source, std::shared_ptr<x11::CaptureControl> control) {
        return std::make_shared<x11::FrameLane>(x11::FrameLaneSetup{
            display, static_cast<std::int32_t>(captureSize.width), static_cast<std::int32_t>(captureSize.height),
            minimumInterval, std::move(control), selection, std::move(source), scheduler});
    };
    return std::make_shared<LaneCaptureSource>(
        LaneCaptureSource::Setup{captureSize, clock_, scheduler_, keeper_, std::move(makeLane)});
}

}  // namespace lumacast
