#pragma once
#include "linux/media/ExportPlan.h"
#include "linux/media/ExportSink.h"
#include "linux/media/MovieSource.h"

namespace lumacast::media {

/// Copies a range of a movie without encoding anything. The copy holds the samples from the key frame on that the
/// range's first picture is decoded from, and an edit list that begins exactly with the range; its end is cut to the
/// tick. Runs to the end on the caller's thread, or until `state` is cancelled.
ExportResult exportPassThrough(MovieSource& source, ExportSink& sink, ExportSpan span, ExportState& state);

}  // namespace lumacast::media
