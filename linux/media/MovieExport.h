#pragma once
#include "linux/media/ExportPlan.h"
#include "linux/media/MovieFile.h"

namespace lumacast::media {

/// Exports as the plan says, into a file that did not exist. Runs to the end on the caller's thread, or until `state`
/// is cancelled; anything but Completed leaves no file.
ExportResult exportMovie(const ExportPlan& plan, MovieFiles& files, ExportState& state);

}  // namespace lumacast::media
