#pragma once
#include <array>
#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <variant>

#include "linux/media/I420Picture.h"
#include "linux/media/TrackSettings.h"

namespace lumacast::media {

/// Which encoders have been found not to work here, so that each is tried once. Shared by a process's encoders;
/// thread-safe.
class EncoderChoice final {
public:
    /// libavcodec's encoders in the order of preference; the last one is software, and in its place stands the software
    /// encoder that the build has chosen.
    static constexpr std::array<const char*, 3> kCandidates{"h264_nvenc", "h264_vaapi", "libx264"};

    std::size_t first() const { return first_.load(std::memory_order_relaxed); }
    void rejectUpTo(std::size_t next) { first_.store(next, std::memory_order_relaxed); }
    /// Software only, for machines and tests where hardware is not wanted.
    void useSoftware() { rejectUpTo(kCandidates.size() - 1); }

private:
    std::atomic<std::size_t> first_ = 0;
};

enum class KeyFrame { IfDue, Forced };

/// One coded picture. `bytes` are an Annex B byte stream, valid during the call that delivers it.
struct EncodedPicture {
    std::span<const std::uint8_t> bytes;
    std::int64_t stamp = 0;  ///< ticks of VideoEncoder::kTimescale
    bool isKeyFrame = false;
};

/// H.264, High profile, level as needed, no B-pictures and no delay: a picture that goes in comes out, or
/// is left out for good to keep to the bit rate (openh264 alone; never a key frame that is forced). Belongs to one thread;
/// opening takes tens of milliseconds. BT.601 limited range, tagged so.
class VideoEncoder {
public:
    static constexpr int kTimescale = 1'000'000;  ///< ticks a second of the stamps

    using Output = std::function<void(const EncodedPicture&)>;
    using Opened = std::variant<std::unique_ptr<VideoEncoder>, Error>;

    /// Hardware is probed by encoding a picture with it, quietly and once; then the software encoder of this build.
    static Opened open(const VideoTrackSettings& settings, EncoderChoice& choice);

    virtual ~VideoEncoder() = default;
    /// Encodes one picture; stamps rise. The picture is read during the call.
    virtual std::optional<Error> encode(const std::shared_ptr<I420Picture>& picture, std::int64_t stamp, KeyFrame key,
                                        const Output& output) = 0;
    /// Delivers what an encoder may still hold, at the end.
    virtual std::optional<Error> drain(const Output& output) = 0;

    /// The parameter sets, an Annex B byte stream.
    virtual std::span<const std::uint8_t> header() const = 0;
};

/// Decides by stamps where key frames must stand. A value; one per track.
class KeyFrameClock final {
public:
    /// Ahead of the second by more than a picture at 30 a second, as the next picture's time is not known yet.
    static constexpr std::int64_t kInterval = VideoEncoder::kTimescale - VideoEncoder::kTimescale / 25;

    KeyFrame next(std::int64_t stamp) const {
        return !last_ || stamp - *last_ >= kInterval ? KeyFrame::Forced : KeyFrame::IfDue;
    }
    void sawKeyFrame(std::int64_t stamp) { last_ = stamp; }

private:
    std::optional<std::int64_t> last_;
};

}  // namespace lumacast::media
