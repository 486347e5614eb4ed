#pragma once
#include "linux/media/ExportPlan.h"
#include "linux/media/ExportSink.h"
#include "linux/media/MovieSource.h"

namespace lumacast::media {

/// Encodes a range of a movie anew and mixes its sound, as the plan says: the picture at the size and the times it has;
/// one sound track, AAC at 128 kbit/s, or the tracks as they are where no mix was asked for. One track alone keeps its
/// level; of several the sum is kept below full scale. What can't be decoded whole fails. At most seven sound tracks
/// and 24 hours. Runs to the end on the caller's thread, or until `state` is cancelled, which it looks at with each
/// picture and each block of sound.
ExportResult exportEncoded(const MovieSource& source, const ExportPlan& plan, ExportSink& sink, ExportSpan span,
                           ExportState& state);

}  // namespace lumacast::media
