#pragma once
#include <cstdint>
#include <functional>
#include <optional>
#include <span>

#include "linux/media/AvHandles.h"
#include "linux/media/PcmReader.h"
#include "writer/media/AudioFormat.h"

namespace lumacast::media {

/// Lays the buffers of one sound track one after the other, by their stamps, at the track's rate: holes are filled with
/// silence, overlaps and what lies before zero cut off, and the slow drift of a device's clock against the stamps is
/// taken up by resampling a little faster or slower. Belongs to one thread.
class SoundTimeline final {
public:
    /// A stamp this far from where the sound stands is a hole or an overlap; nearer ones are jitter, or drift. Sound
    /// servers stamp within a few milliseconds.
    static constexpr std::int64_t kJitterNanoseconds = 20'000'000;

    /// `take` removes from sound() what it can use; called whenever something was laid out, so that a long hole never
    /// stands in memory as a whole.
    SoundTimeline(int sampleRate, std::function<void()> take) : sampleRate_(sampleRate), take_(std::move(take)) {}

    /// Adds a buffer that begins at `nanoseconds` after the movie's zero. False for a format that can't be read.
    bool add(const AudioFormat& format, std::span<const std::uint8_t> bytes, std::size_t frameCount,
             std::int64_t nanoseconds);
    /// The same for sound that has been read already, of so many frames a second.
    bool add(const StereoSound& sound, int rate, std::int64_t nanoseconds);
    /// Adds what the resampler still holds, after the last buffer.
    void finish();
    /// After finish: adds silence until `nanoseconds` after zero, if that is at most `most` of them.
    void extend(std::int64_t nanoseconds, std::int64_t most);

    /// Where the track's sound begins, frames after the movie's zero; none before the first sound.
    std::optional<std::int64_t> origin() const { return origin_; }
    /// How many frames were added since one that was not silent, at their own rate. Holes don't count.
    std::int64_t silentFrames() const { return silentFrames_; }
    /// What is laid out and not taken yet.
    StereoSound& sound() { return sound_; }

private:
    bool adopt(const AudioFormat& format);
    void layOut(std::int64_t nanoseconds);
    /// Frames after zero at which the next sound would stand, what the resampler holds included.
    std::int64_t end() const;
    void emptyResampler();
    void resample(const StereoSound& input);
    void place(std::int64_t start);
    void fillHole(std::int64_t frames);
    void correctDrift(std::int64_t late);
    void dropIncoming(std::int64_t trackFrames);

    const std::int64_t sampleRate_;
    const std::function<void()> take_;
    StereoSound sound_;     ///< laid out and not taken
    StereoSound incoming_;  ///< the buffer at hand, at its own rate
    std::optional<AudioFormat> format_;
    AvOwned<SwrContext> resampler_;
    std::optional<std::int64_t> origin_;
    std::int64_t placed_ = 0;         ///< frames after zero up to which sound has been laid out
    double smoothedLate_ = 0;         ///< frames by which stamps run ahead of the sound, averaged
    std::int64_t nextCorrection_ = 0; ///< frames after zero before which the resampler's speed is left alone
    bool corrects_ = false;
    std::int64_t silentFrames_ = 0;
};

}  // namespace lumacast::media
