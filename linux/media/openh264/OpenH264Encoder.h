#pragma once
#include <wels/codec_api.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <vector>

#include "linux/media/VideoEncoder.h"
#include "linux/media/openh264/RateCeiling.h"

namespace lumacast::media {

/// The library openh264, by its own interface. It encodes what is recorded; what is saved is encoded anew by x264 all
/// the same (PictureReencoder). Its coarsest pictures can still be too large for the bit rate: then some are left out.
class OpenH264Encoder final : public VideoEncoder {
public:
    static Opened open(const VideoTrackSettings& settings);

    std::optional<Error> encode(const std::shared_ptr<I420Picture>& picture, std::int64_t stamp, KeyFrame key,
                                const Output& output) override;
    /// It holds nothing back.
    std::optional<Error> drain(const Output& /*output*/) override { return std::nullopt; }
    std::span<const std::uint8_t> header() const override { return header_; }

private:
    struct Destroy {
        void operator()(ISVCEncoder* encoder) const {
            encoder->Uninitialize();
            WelsDestroySVCEncoder(encoder);
        }
    };
    using Handle = std::unique_ptr<ISVCEncoder, Destroy>;

    OpenH264Encoder(Handle encoder, std::vector<std::uint8_t> header, std::int64_t bitRate)
        : encoder_(std::move(encoder)), header_(std::move(header)), ceiling_(bitRate) {}

    const Handle encoder_;
    const std::vector<std::uint8_t> header_;
    RateCeiling ceiling_;
    std::vector<std::uint8_t> bytes_;  ///< of the picture that is being delivered
};

}  // namespace lumacast::media
