#include "headless/display/SyntheticDisplay.h"

#include <utility>

#include "headless/display/SyntheticLane.h"
#include "linux/display/LaneCaptureSource.h"

namespace lumacast::headless {

std::shared_ptr<DisplayCaptureSource> SyntheticDisplay::makeSource(Size captureSize, MediaTime minimumInterval) {
    auto makeLane = [show = show_](x11::CaptureLaneSetup setup) {
        return std::make_shared<SyntheticLane>(show, std::move(setup));
    };
    return std::make_shared<LaneCaptureSource>(LaneCaptureSource::Setup{
        captureSize, minimumInterval, clock_, scheduler_, selection_, keeper_, std::move(makeLane)});
}

}  // namespace lumacast::headless
