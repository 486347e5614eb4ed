// The software encoder of a build with LC_H264=x264.

#include "linux/media/SoftwareEncoder.h"

#include "linux/media/AvVideoEncoder.h"

namespace lumacast::media {

VideoEncoder::Opened openSoftwareEncoder(const VideoTrackSettings& settings) {
    return AvVideoEncoder::openNamed("libx264", settings);
}

}  // namespace lumacast::media
