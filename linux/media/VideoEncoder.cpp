#include "linux/media/VideoEncoder.h"

#include <cstring>

#include "linux/media/AvVideoEncoder.h"
#include "linux/media/SoftwareEncoder.h"

namespace lumacast::media {

namespace {

/// A device counts only when a picture comes out as asked: at once, as a key frame, with parameter sets known.
bool works(VideoEncoder& encoder, const VideoTrackSettings& settings) {
    const auto grey = std::make_shared<I420Picture>(settings.width, settings.height);
    std::memset(grey->y(), 128, grey->byteCount());
    int keyFrames = 0;
    const auto failed = encoder.encode(grey, 0, KeyFrame::Forced,
                                       [&](const EncodedPicture& picture) { keyFrames += picture.isKeyFrame; });
    return !failed && keyFrames == 1 && !encoder.header().empty();
}

}  // namespace

VideoEncoder::Opened VideoEncoder::open(const VideoTrackSettings& settings, EncoderChoice& choice) {
    const std::size_t last = EncoderChoice::kCandidates.size() - 1;
    for (std::size_t candidate = choice.first(); candidate < last; ++candidate) {
        auto opened = AvVideoEncoder::openNamed(EncoderChoice::kCandidates[candidate], settings);
        auto* const encoder = std::get_if<0>(&opened);
        if (encoder && works(**encoder, settings)) {
            choice.rejectUpTo(candidate);
            return AvVideoEncoder::openNamed(EncoderChoice::kCandidates[candidate], settings);
        }
    }
    choice.rejectUpTo(last);
    return openSoftwareEncoder(settings);
}

}  // namespace lumacast::media
