#pragma once
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <variant>

#include "linux/media/AvHandles.h"
#include "linux/media/PcmReader.h"
#include "linux/media/TrackSettings.h"

namespace lumacast::media {

/// AAC-LC. Takes stereo sound of the track's rate, gives packets of packetFrames() frames, the first primingFrames()
/// frames of which come before the sound. Belongs to one thread.
class AudioEncoder final {
public:
    using Output = std::function<void(std::span<const std::uint8_t> packet)>;

    static std::variant<std::unique_ptr<AudioEncoder>, Error> open(const AudioTrackSettings& settings);

    /// Encodes `packetFrames()` frames of `sound` from `first` on, or what is left of it, filled up with silence. Only
    /// the last call before drain may fall short.
    std::optional<Error> encode(const StereoSound& sound, std::size_t first, const Output& output);
    std::optional<Error> drain(const Output& output);

    std::uint32_t packetFrames() const { return static_cast<std::uint32_t>(context_->frame_size); }
    std::uint32_t primingFrames() const { return static_cast<std::uint32_t>(context_->initial_padding); }
    /// The AudioSpecificConfig.
    std::span<const std::uint8_t> header() const {
        return {context_->extradata, static_cast<std::size_t>(context_->extradata_size)};
    }

private:
    explicit AudioEncoder(AvOwned<AVCodecContext> context);
    std::optional<Error> receive(const Output& output);

    AvOwned<AVCodecContext> context_;
    AvOwned<AVFrame> frame_;
    AvOwned<AVPacket> packet_;
    std::int64_t position_ = 0;
};

}  // namespace lumacast::media
