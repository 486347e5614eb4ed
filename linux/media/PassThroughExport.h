#pragma once
#include <atomic>
#include <memory>
#include <optional>
#include <string>

#include "linux/media/MovieFile.h"
#include "platform/MovieExporter.h"

namespace lumacast::media {

/// What is copied from where to where.
struct ExportPlan {
    std::string source;
    std::string destination;
    std::optional<MediaTimeRange> range;  ///< none: all of it
};

struct ExportResult {
    ExportStatus status = ExportStatus::Failed;
    std::optional<Error> error;
};

/// Copies a range of a movie without encoding anything. The copy holds the samples from the key frame on that the
/// range's first picture is decoded from, and an edit list that begins exactly with the range; its end is cut to the
/// tick. Runs to the end on the caller's thread, or until `cancelled`; anything but Completed leaves no file.
ExportResult exportMovie(const ExportPlan& plan, MovieFiles& files, const std::atomic<bool>& cancelled);

}  // namespace lumacast::media
