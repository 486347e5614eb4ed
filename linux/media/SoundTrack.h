#pragma once
#include <cstdint>
#include <functional>
#include <limits>
#include <memory>
#include <optional>
#include <variant>

#include "linux/media/AudioEncoder.h"
#include "linux/media/SoundTimeline.h"
#include "linux/media/mp4/MovieBoxWriter.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast::media {

/// One sound track on its way from samples to the movie file. Belongs to the movie's encoder thread.
class SoundTrack final {
public:
    /// Opens the encoder and declares the track.
    static std::variant<std::unique_ptr<SoundTrack>, Error> open(const AudioTrackSettings& settings, std::string name,
                                                                 mp4::MovieBoxWriter& movie);

    /// Adds a buffer that begins at `nanoseconds` after the movie's zero. Buffers of a format that can't be read are
    /// dropped.
    std::optional<Error> add(const SampleBuffer& sample, std::int64_t nanoseconds);
    /// The same for sound that has been read already, of so many frames a second.
    std::optional<Error> add(const StereoSound& sound, int rate, std::int64_t nanoseconds);
    /// Ends the track. Silence may come late, so where the sound was silent at last it lasts until `end` (nanoseconds after
    /// zero), unless that is far off.
    std::optional<Error> finish(std::optional<std::int64_t> end = std::nullopt);

    /// Whether nothing that was added can be heard in what is not encoded yet, or has just been.
    bool isSilent() const { return timeline_.silentFrames() >= kSilentFrames; }

private:
    /// More than the encoder and the resampler hold back.
    static constexpr std::int64_t kSilentFrames = 8192;

    SoundTrack(const AudioTrackSettings& settings, std::unique_ptr<AudioEncoder> encoder, mp4::MovieBoxWriter& movie);
    enum class Rest { Keep, Encode };
    void encode(Rest rest);
    void deliver(std::span<const std::uint8_t> packet);

    const std::unique_ptr<AudioEncoder> encoder_;
    mp4::MovieBoxWriter& movie_;
    mp4::TrackId track_{};
    SoundTimeline timeline_;
    std::int64_t encoded_ = 0;    ///< frames of sound given to the encoder
    std::int64_t delivered_ = 0;  ///< frames of packets, priming included
    /// Frames of all packets, priming included, that are sound: known at the end, when the last packet is cut to it.
    std::int64_t total_ = std::numeric_limits<std::int64_t>::max();
    std::optional<Error> error_;
};

/// What the box writer's answer means to a recording: nothing for a sample that it merely left out, the sink's failure
/// as EIO (the disk's thread knows better and has reported it first).
std::optional<Error> movieError(mp4::MovieError error);

}  // namespace lumacast::media
