#pragma once
#include "linux/media/VideoEncoder.h"

namespace lumacast::media {

/// Opens the software encoder that the build has chosen (LC_H264): the one file that defines this is linked in.
VideoEncoder::Opened openSoftwareEncoder(const VideoTrackSettings& settings);

}  // namespace lumacast::media
