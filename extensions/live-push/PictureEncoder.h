#pragma once
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "extensions/media/Av.h"

namespace lumacast::extensions {

/// H.264 without delay: each picture's packet comes at once. Not thread-safe.
class PictureEncoder final {
public:
    static constexpr int kTicksPerSecond = 90'000;
    /// Players that come later wait no longer than this for a picture.
    static constexpr std::int64_t kTicksBetweenKeyFrames = 2 * kTicksPerSecond;

    PictureEncoder(int width, int height, std::int64_t bitRate);

    /// Empty when the encoder could be opened; the reason otherwise, and then nothing is encoded.
    const std::string& error() const { return error_; }
    const AVCodecContext* context() const { return encoder_.get(); }

    /// `ticks` rise from picture to picture. A key frame two seconds after the last one, and where `wantsKeyFrame`.
    std::vector<AvOwned<AVPacket>> encode(AVFrame& picture, std::int64_t ticks, bool wantsKeyFrame);

private:
    AvOwned<AVCodecContext> encoder_;
    std::string error_;
    std::optional<std::int64_t> lastKeyFrame_;
};

}  // namespace lumacast::extensions
