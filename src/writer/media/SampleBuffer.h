#pragma once
// One timed unit of media.

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <vector>

#include "base/Value.h"
#include "writer/media/AudioFormat.h"
#include "writer/media/MediaTime.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast {

/// The timing of one sample of a buffer. Plain data, 72 bytes in this order, also where it leaves the process.
struct SampleTiming {
    MediaTime duration;
    MediaTime presentation;
    MediaTime decode;
};
static_assert(sizeof(SampleTiming) == 72);

enum class MediaType : std::uint8_t { Video, Audio };

/// What the samples of a buffer are.
struct FormatDescription {
    MediaType type = MediaType::Video;
    AudioFormat audio;  ///< for audio only
};

class SampleBuffer;
/// Samples are shared: a holder that keeps one past the call that delivered it keeps the reference.
using SampleRef = std::shared_ptr<const SampleBuffer>;

/// One video frame or a run of audio packets. Immutable, but for overwriteDataWithZero.
class SampleBuffer {
public:
    /// For the makers below and SampleMaker: everybody else gets a reference.
    class Key {
        friend class SampleBuffer;
        friend class SampleMaker;
        Key() = default;
    };
    SampleBuffer(Key, PixelBuffer image, MediaTime presentation, MediaTime duration);
    SampleBuffer(Key, const AudioFormat& format, std::shared_ptr<Data> data, std::int64_t sampleCount,
                 const SampleTiming& timing);

    /// A video frame. `decode` is left invalid.
    static SampleRef makeVideo(PixelBuffer image, MediaTime presentation, MediaTime duration);
    /// A run of `sampleCount` audio samples in `format`.
    static SampleRef makeAudio(const AudioFormat& format, Data data, std::int64_t sampleCount, SampleTiming timing);

    /// The same payload with other timing entries; the payload is shared, not copied. Null when the copy can't be made.
    SampleRef copyWithTiming(std::vector<SampleTiming> timing) const;

    const FormatDescription& format() const { return format_; }
    /// The first entry's presentation time; invalid when there is no entry.
    MediaTime presentationTime() const;
    /// The first entry's duration for one entry that stands for all samples; invalid when there is no entry.
    MediaTime duration() const;
    std::int64_t sampleCount() const { return sampleCount_; }
    /// For as long as the buffer.
    std::span<const SampleTiming> timing() const {
        return several_.empty() ? std::span(&timing_, timingCount_) : std::span(several_);
    }
    /// The picture of a video frame; none for audio.
    const std::optional<PixelBuffer>& image() const { return image_; }
    /// The bytes of an audio buffer; null for video.
    std::shared_ptr<const Data> data() const { return data_; }
    /// Makes every byte of an audio buffer zero, in place: for all who share it. Only for whom the buffer was just
    /// delivered to, before anybody else has it.
    void overwriteDataWithZero() const;

private:
    FormatDescription format_;
    // Nearly always one entry, for which a frame takes no memory of its own.
    SampleTiming timing_;
    std::size_t timingCount_ = 1;
    std::vector<SampleTiming> several_;
    std::int64_t sampleCount_ = 0;
    std::optional<PixelBuffer> image_;
    std::shared_ptr<Data> data_;
};

}  // namespace lumacast
