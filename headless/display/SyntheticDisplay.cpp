#include "headless/display/SyntheticDisplay.h"

#include <utility>

#include "headless/display/SyntheticLane.h"
#include "linux/display/LaneCaptureSource.h"

namespace lumacast::headless {

std::shared_ptr<DisplayCaptureSource> SyntheticDisplay::makeSource(Size captureSize, MediaTime minimumInterval) {
    auto makeLane = [show = show_, captureSize, minimumInterval, selection = selection_, scheduler = &scheduler_](
                        std::weak_ptr<DisplayCaptureSource> source, std::shared_ptr<x11::CaptureControl> control) {
        return std::make_shared<SyntheticLane>(SyntheticLaneSetup{
            show, static_cast<std::int32_t>(captureSize.width), static_cast<std::int32_t>(captureSize.height),
            minimumInterval, std::move(control), selection, std::move(source), scheduler});
    };
    return std::make_shared<LaneCaptureSource>(
        LaneCaptureSource::Setup{captureSize, clock_, scheduler_, keeper_, std::move(makeLane)});
}

}  // namespace lumacast::headless
