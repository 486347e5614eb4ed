#pragma once
// One clip, read whole.

#include <cstdint>
#include <string>
#include <vector>

#include "extensions/media/Av.h"
#include "extensions/media/StereoSound.h"
#include "linux/ipc/Fd.h"

namespace lumacast::extensions {

/// Ticks of the stream's time.
inline constexpr int kTicksPerSecond = 90'000;

/// What a clip holds. Times begin with the clip.
struct ClipMedia {
    AvOwned<AVCodecParameters> video;         ///< null for a clip without pictures
    std::vector<AvOwned<AVPacket>> pictures;  ///< in decoding order; times in ticks, as an edit list shows them
    std::int64_t pictureEnd = 0;              ///< ticks; when the last picture ends
    StereoSound sound;                        ///< of all sound tracks together, from time zero; empty without one
    int soundRate = 0;                        ///< the first sound track's own; 0 without one
};

/// Reads an MP4 file from its descriptor, which is not moved: the pictures as they are, the sound decoded, its tracks
/// mixed, `rate` samples a second (the first track's own when 0). Blocks. The reason when the file can't be read, else
/// empty.
[[nodiscard]] std::string readClip(const Fd& movie, int rate, ClipMedia& media);

}  // namespace lumacast::extensions
