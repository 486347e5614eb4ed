#pragma once
#include <cstdint>
#include <memory>
#include <optional>
#include <span>

#include "linux/media/AvHandles.h"
#include "linux/media/VideoEncoder.h"

namespace lumacast::media {

/// One of libavcodec's encoders.
class AvVideoEncoder final : public VideoEncoder {
public:
    /// By libavcodec's name, which must be one of EncoderChoice::kCandidates.
    static Opened openNamed(const char* name, const VideoTrackSettings& settings);

    std::optional<Error> encode(const std::shared_ptr<I420Picture>& picture, std::int64_t stamp, KeyFrame key,
                                const Output& output) override;
    std::optional<Error> drain(const Output& output) override;
    std::span<const std::uint8_t> header() const override;

private:
    AvVideoEncoder(AvOwned<AVCodecContext> context, AvOwned<AVBufferRef> uploads);

    void paceRate(std::int64_t stamp);
    bool show(const std::shared_ptr<I420Picture>& picture);
    int send(AVFrame* frame);
    std::optional<Error> receive(const Output& output);

    AvOwned<AVCodecContext> context_;
    AvOwned<AVBufferRef> uploads_;  ///< frames in the device's memory; null for encoders that read ours
    AvOwned<AVFrame> frame_;        ///< keeps the picture alive that it shows: mostly it is one all the time
    const I420Picture* shown_ = nullptr;
    AvOwned<AVFrame> uploaded_;
    AvOwned<AVPacket> packet_;
    std::optional<std::int64_t> lastStamp_;
};

}  // namespace lumacast::media
