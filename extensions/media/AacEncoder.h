#pragma once
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "extensions/media/Av.h"
#include "extensions/media/StereoSound.h"

namespace lumacast::extensions {

/// Makes AAC of sound that is given in pieces and goes on without a break: what was left of one piece is encoded with
/// the next. Not thread-safe.
class AacEncoder final {
public:
    /// `startSample` is the time of the first sample that will be given, in samples.
    AacEncoder(int sampleRate, std::int64_t bitRate, std::int64_t startSample);

    /// Empty when the encoder could be opened; the reason otherwise, and then nothing is encoded.
    const std::string& error() const { return error_; }
    int sampleRate() const { return sampleRate_; }
    const AVCodecContext* context() const { return encoder_.get(); }
    /// The time of the sample that is expected next, in samples.
    std::int64_t position() const { return position_; }

    /// Encodes what fills whole packets. Packets' times are in samples; those from before the first sample (the
    /// encoder's run-up) are left out.
    std::vector<AvOwned<AVPacket>> encode(const StereoSound& sound);
    /// What is left, after the last piece. Nothing may be given after it.
    std::vector<AvOwned<AVPacket>> finish();

private:
    void encodeFrame(std::size_t from, std::size_t count, std::vector<AvOwned<AVPacket>>& packets);
    void collect(std::vector<AvOwned<AVPacket>>& packets);

    const int sampleRate_;
    const std::int64_t start_;
    std::int64_t position_;
    std::int64_t encoded_;  ///< time of the first sample that waits
    StereoSound waiting_;
    AvOwned<AVCodecContext> encoder_;
    std::string error_;
};

}  // namespace lumacast::extensions
