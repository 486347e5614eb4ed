#include "linux/media/ExportPlan.h"

#include <cerrno>

#include "linux/media/AvHandles.h"
#include "linux/media/PictureTrack.h"

namespace lumacast::media {

std::variant<ExportSpan, Error> spanOf(const ExportPlan& plan, std::int64_t movieDuration) {
    if (!plan.range) return ExportSpan{0, movieDuration};
    const auto start = nanosecondsOf(plan.range->start);
    const auto end = nanosecondsOf(add(plan.range->start, plan.range->duration));
    const bool isInside = start && end && *start >= 0 && *end > *start && *end <= movieDuration;
    if (!isInside) return systemError(EINVAL);
    return ExportSpan{*start, *end};
}

}  // namespace lumacast::media
