#pragma once
// Where a tap's streams meet: each laid out in time by itself, and read together.

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <span>
#include <utility>
#include <vector>

#include "base/Date.h"

namespace lumacast::sound {

/// The last second or so of one stream, by frame number. What was not written is silence. Not thread-safe: the mix's.
class SoundLane final {
public:
    /// Adds what is heard from `moment` on to samples that are there already. Pure.
    using Computed = std::function<void(HostTime moment, std::span<float> interleaved)>;

    explicit SoundLane(std::size_t capacityFrames, Computed computed = {})
        : frames_(capacityFrames), computed_(std::move(computed)) {}

private:
    friend class TapMix;
    const std::size_t frames_;
    const Computed computed_;     ///< in place of samples
    std::vector<float> samples_;  ///< empty until something is written
    std::int64_t begin_ = 0, end_ = 0;  ///< frames that may be other than silence
    bool isTrusted_ = false;
    bool isClosed_ = false;
};

/// The sound of one tap, counted in frames from its start at the tap's rate: frame n is what was heard n / rate seconds
/// after it. Streams are written by the sound thread and read by the queue's thread, a moment later (delay), so that
/// what arrives a little late still finds its place; where it did not, the delay grows. Thread-safe (a leaf lock).
class TapMix final {
public:
    /// Sound is read this long after it was heard, at first and at most.
    static constexpr std::int64_t kFirstDelay = 60'000'000, kLongestDelay = 500'000'000;

    TapMix(double rate, std::uint32_t channels, HostTime start);

    double rate() const { return rate_; }
    std::uint32_t channels() const { return channels_; }
    /// When frame `frame` was heard, and which frame is heard then.
    HostTime momentOf(std::int64_t frame) const;
    std::int64_t frameAt(HostTime moment) const;

    /// Called on the thread that adds a stream, before anything is written to it, without the lock. To be set before the
    /// mix is shared.
    void whenStreamComes(std::function<void()> told) { streamComes_ = std::move(told); }
    /// A new stream; nothing of it is read until it is trusted, but what was written a moment before then is.
    std::shared_ptr<SoundLane> addLane();
    /// A stream that nobody writes: what it plays is computed when it is read, under the mix's lock. Trusted at once, and
    /// nobody is told of it: it may be added by whoever reads.
    std::shared_ptr<SoundLane> addComputedLane(SoundLane::Computed computed);
    void trust(SoundLane& lane);
    /// Nothing more comes; what is there is read if the lane is trusted, or thrown away.
    void closeLane(const std::shared_ptr<SoundLane>& lane);
    /// All that was not read yet is thrown away.
    void discardLane(const std::shared_ptr<SoundLane>& lane);
    void write(SoundLane& lane, std::int64_t frame, std::span<const float> interleaved);

    /// There has been no stream for a while: what is read is silence, and nobody needs it soon.
    bool isQuiet() const;
    /// The first frame that was not read yet.
    std::int64_t position() const;
    /// How many frames can be read at this moment.
    std::int64_t readable(HostTime now) const;
    /// When `frames` frames will be readable, as things stand.
    HostTime readableFrom(std::int64_t frames) const;
    /// Reads the sum of all streams into `interleaved` (a whole number of frames), and goes on behind it. Not limited to
    /// full scale.
    void read(std::span<float> interleaved);
    /// Goes on at `frame` without reading what is before.
    void skipTo(std::int64_t frame);

private:
    void forgetLocked(SoundLane& lane, std::int64_t before);

    const double rate_;
    const std::uint32_t channels_;
    const HostTime start_;
    const std::size_t laneFrames_;
    std::function<void()> streamComes_;

    mutable std::mutex mutex_;
    std::vector<std::shared_ptr<SoundLane>> lanes_;
    std::int64_t position_ = 0;
    std::int64_t lastWithStream_ = 0;  ///< where the last one ended
    std::int64_t delay_ = kFirstDelay;
};

}  // namespace lumacast::sound
