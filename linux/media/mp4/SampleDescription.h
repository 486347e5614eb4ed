#pragma once

#include "linux/media/mp4/TrackDescription.h"

namespace lumacast::mp4 {

class BoxBuffer;

// Whether the description can be written: sizes and rates set, parameter sets readable and within the fields' widths.
[[nodiscard]] bool isValid(const VideoTrackDescription& track);
[[nodiscard]] bool isValid(const AudioTrackDescription& track);

// The sample description box with its one entry, avc1 or mp4a. The description must be valid.
void writeSampleDescription(BoxBuffer& out, const VideoTrackDescription& track);
void writeSampleDescription(BoxBuffer& out, const AudioTrackDescription& track);

}  // namespace lumacast::mp4
