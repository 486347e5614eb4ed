#include "linux/media/ExportPlan.h"

#include <cerrno>

#include "linux/media/AvHandles.h"
#include "linux/media/MovieFile.h"
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

void ExportState::beginFile(MovieFile& file) {
    const std::lock_guard lock(mutex_);
    file_ = &file;
}

void ExportState::endFile() {
    const std::lock_guard lock(mutex_);
    file_ = nullptr;
    changed_.notify_all();
}

void ExportState::removeUnfinished(const std::string& path, std::chrono::steady_clock::time_point deadline) {
    std::unique_lock lock(mutex_);
    if (changed_.wait_until(lock, deadline, [this] { return !file_; })) return;
    file_->removeName(path);
}

}  // namespace lumacast::media
