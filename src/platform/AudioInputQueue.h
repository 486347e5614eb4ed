#pragma once
// The tap of one process's sound: a queue of buffers that are filled with what the process plays.

#include <cstdint>
#include <functional>
#include <memory>
#include <span>

#include "base/Identifiers.h"
#include "writer/media/AudioFormat.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast {

/// What the operations of an audio queue answer.
namespace AudioStatus {
inline constexpr std::int32_t kSuccess = 0;
inline constexpr std::int32_t kBadFormat = -1;       ///< no queue can deliver this format
inline constexpr std::int32_t kNoSuchProcess = -2;   ///< below 1, or not running
inline constexpr std::int32_t kBadBuffer = -3;       ///< not of this queue, freed, or enqueued already
inline constexpr std::int32_t kTooManyBuffers = -4;  ///< over AudioInputQueue::kMostBuffers
inline constexpr std::int32_t kBadSize = -5;         ///< a buffer of no bytes, or over kMostBufferBytes
inline constexpr std::int32_t kBadState = -6;        ///< the process set after the start
inline constexpr std::int32_t kDisposed = -7;        ///< the queue has been disposed of
inline constexpr std::int32_t kNoResources = -8;     ///< the system has no thread left
inline constexpr std::int32_t kBadFlags = -9;        ///< creation flags that are not known
}  // namespace AudioStatus

/// When a buffer's first sample was played.
struct AudioTimeStamp {
    double sampleTime = 0;       ///< samples since the queue's start
    std::uint64_t hostTime = 0;  ///< nanoseconds on the recording's capture clock
    double rateScalar = 1;
    std::uint32_t flags = 0;     ///< see below

    static constexpr std::uint32_t kSampleTimeValid = 1, kHostTimeValid = 2, kRateScalarValid = 4;
    bool operator==(const AudioTimeStamp&) const = default;
};

/// Where one packet of a buffer lies. Formats whose packets are all alike have none.
struct AudioPacketDescription {
    std::int64_t startOffset = 0;
    std::uint32_t framesInPacket = 0;
    std::uint32_t byteSize = 0;
    bool operator==(const AudioPacketDescription&) const = default;
};

/// One buffer of a queue. While it is enqueued it belongs to the queue, from its callback until it is enqueued again
/// to whoever has it.
struct AudioQueueBuffer {
    Data bytes;                  ///< as long as the buffer was allocated
    std::uint32_t byteSize = 0;  ///< how many of them are filled
};
using AudioQueueBufferRef = std::shared_ptr<AudioQueueBuffer>;

/// Records what one process plays, all its streams mixed, with those of its descendants of the same bundle identifier,
/// and nothing else, ever: where there is nothing to be had (the process plays nothing, there is no sound server, the
/// server has gone) it delivers silence, and it joins in when it can. So from the start on the sound has no hole.
///
/// Buffers are filled in the order in which they were enqueued. One is handed over as soon as 20 ms are in it, however
/// large it is; after two seconds without a stream each 200 ms, or later (allowLateSilence), until one comes. Until the
/// first of the queue's buffers has been enqueued a second time, the last five left are handed over only when they are
/// full, so that an owner who drops some buffers at first does not lose them all. Sound is stamped with the capture
/// clock that is current when the queue is started; what is heard while that clock stands still is thrown away, and so
/// is what finds no buffer to be filled. A queue that has had no buffer to fill for a second gives its stream back to
/// the server; the next buffer brings it back.
///
/// Lanes: callbacks come on the queue's own thread, one at a time, never inline from an operation. All operations are
/// callable from any lane, also from within a callback, and wait for nobody, least of all for the sound server. A
/// queue lives as long as it is referred to; releasing the last reference disposes of it, also within its callback.
class AudioInputQueue {
public:
    static constexpr std::uint32_t kMostBuffers = 64;
    static constexpr std::uint32_t kMostBufferBytes = 1u << 20;

    /// A filled buffer, the time of its first sample, how many packets are in it, and their descriptions where the
    /// format has any: those are valid during the call only.
    using InputCallback = std::function<void(const AudioQueueBufferRef& buffer, const AudioTimeStamp& start,
                                             std::uint32_t packetCount,
                                             std::span<const AudioPacketDescription> descriptions)>;
    using IsRunningListener = std::function<void()>;

    virtual ~AudioInputQueue() = default;

    /// Whose sound is recorded; before the start. Without it nobody's: silence.
    virtual std::int32_t setProcessTap(ProcessID pid) = 0;
    /// The format in which the queue delivers. `format` is left alone on failure, as in the operations below.
    virtual std::int32_t streamFormat(AudioFormat& format) const = 0;
    virtual std::int32_t maximumOutputPacketSize(std::uint32_t& bytes) const = 0;

    virtual std::int32_t allocateBuffer(std::uint32_t bytes, AudioQueueBufferRef& buffer) = 0;
    /// Gives a buffer to be filled.
    virtual std::int32_t enqueueBuffer(const AudioQueueBufferRef& buffer) = 0;
    /// Nobody listens while it comes: while there is nothing to be had, silence may be handed over up to a second late, and
    /// so with fewer wake-ups. Sound never is. Before the start. A permission: a queue that has no use for it ignores it.
    virtual void allowLateSilence() {}
    /// The queue forgets the buffer, enqueued or not.
    virtual std::int32_t freeBuffer(const AudioQueueBufferRef& buffer) = 0;

    /// Called on the queue's thread each time the queue has begun or ceased to run. One at a time; it stays until it is
    /// removed, which is harmless where there is none and legal within its call.
    virtual std::int32_t addIsRunningListener(IsRunningListener listener) = 0;
    virtual std::int32_t removeIsRunningListener() = 0;

    /// Starts at once; within 100 ms the queue runs, sound server or not. Nothing when it was started before.
    virtual std::int32_t start() = 0;
    /// Stops at once: no callback begins after the return; one in progress may still be running. What was filled and not
    /// handed over yet is thrown away; the buffers stay enqueued. Nothing when it is not running.
    virtual std::int32_t stop() = 0;
    /// Stops, lets go of all buffers, of the callback and of the listener. Every operation answers kDisposed then.
    virtual std::int32_t dispose() = 0;
};

/// Makes audio queues.
class AudioInputQueues {
public:
    /// Nothing is played back for the recorder, and what it records is not a device: the one kind there is.
    static constexpr std::uint32_t kCaptureProcessOutput = 0x800;

    struct Made {
        std::int32_t status = AudioStatus::kSuccess;
        /// Never null: what could not be made answers every operation with `status`.
        std::shared_ptr<AudioInputQueue> queue;
    };

    virtual ~AudioInputQueues() = default;
    /// A queue that delivers linear PCM of `format`: integers of 16, 24 or 32 bits or floats of 32, of either byte
    /// order, packed, one or two channels, 8 to 192 kHz; a field of it that is 0 and follows from the others is filled
    /// in, see AudioInputQueue::streamFormat.
    virtual Made makeInputQueue(const AudioFormat& format, AudioInputQueue::InputCallback callback,
                                std::uint32_t flags) = 0;
};

}  // namespace lumacast
