#pragma once
// Screen frames: the capture source, its gate, and which layers it shows.

#include <cstdint>
#include <memory>
#include <set>

#include "base/Identifiers.h"
#include "writer/media/MediaTime.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast {

class DisplayCaptureSource;

/// The bits of a frame's transform flags: how it is to be turned and mirrored to be upright. Higher bits carry no
/// meaning.
enum FrameTransformFlag : std::uint32_t { kFlipY = 1, kFlipX = 2, kRotateClockwise = 4 };

/// Told of frames and failures by a capture source. Frames come on the source's own delivery thread (the frame lane),
/// one at a time; failures on the main queue. Nothing is called inline from an operation of the source. What happened to
/// capture before the source was last started is not told any more.
class DisplayCaptureDelegate {
public:
    virtual ~DisplayCaptureDelegate() = default;
    /// One frame, stamped with the recording's capture clock, its duration the minimum interval. `transformFlags` is
    /// made of FrameTransformFlag.
    virtual void screenCaptureControllerDidReceiveSampleBuffer(DisplayCaptureSource& source, const SampleRef& sample,
                                                               std::uint32_t transformFlags) = 0;
    /// Capture failed with this status and has ended.
    virtual void screenCaptureControllerDidFailWithStatus(DisplayCaptureSource& source, std::int32_t status) = 0;
    /// Something of higher priority has taken the display, as when the screen is locked or dark while all of it is
    /// mirrored. Capture has ended; told once for each start. A source that is started meanwhile tells it, too, and
    /// delivers no new picture.
    virtual void screenCaptureControllerWasPreempted(DisplayCaptureSource& source) = 0;
    /// The media services were reset, as when the display goes while all of it is mirrored; nothing captured before is
    /// of use. Capture has ended.
    virtual void screenCaptureControllerMediaServicesWereReset(DisplayCaptureSource& source) = 0;
};

enum class GateWait : bool { No, UntilDelivered };

/// Delivers what the display clone shows, as frames. Frames come when something changed, in the long run never faster
/// than the minimum interval (one that came late may be followed by the next after half of it, so that no picture of a
/// steady stream is lost); the first at once after a start, and at least one each second.
///
/// Lifetime: shared; the delegate is held weakly. All operations are callable from any lane, also from within a
/// delivery, and never wait for the delivery thread, but for a bounded closeGate. Destroying the last reference from
/// within a delivery is legal.
class DisplayCaptureSource {
public:
    virtual ~DisplayCaptureSource() = default;

    /// Whom to deliver to; an empty pointer for nobody. A delivery in progress ends as it began.
    virtual void setDelegate(std::weak_ptr<DisplayCaptureDelegate> delegate) = 0;

    /// Opens the capture gate and takes the clock of the current recording. A source starts closed, and stays so before
    /// the first recording.
    virtual void openGate() = 0;
    /// Closes the gate: from its return on (with `UntilDelivered`, which waits at most 100 ms for a delivery in
    /// progress, and not at all on the delivery thread itself) nothing is delivered, the capture clock stands, and
    /// start does nothing. Delivery ends as by stop(): once the gate is open again it takes a start.
    virtual void closeGate(GateWait wait) = 0;

    /// Starts delivery, if the gate is open. Idempotent. A source that was started before in the same recording (the
    /// same capture clock) first delivers its last picture once more with the stamp it had, then at once the current
    /// picture with the clock's time, so that the gap of a pause is zero on the clock. The clock runs from the first
    /// picture on.
    virtual void start() = 0;
    /// Ends delivery. A delivery in progress may still be running at return.
    virtual void stop() = 0;

    /// For status reports, callable from any lane: pictures delivered, and pictures that were due but dropped because
    /// every plane was in use or the delegate was too slow.
    struct Counters {
        std::uint64_t delivered = 0;
        std::uint64_t dropped = 0;
    };
    virtual Counters counters() const = 0;
};

/// Makes capture sources.
class DisplayCapture {
public:
    virtual ~DisplayCapture() = default;
    /// A source whose frames have this size (fractions are cut off, odd sizes are kept) and come at least
    /// `minimumInterval` apart. Frames of the whole display are always portrait, the native orientation: the shorter
    /// side is their width. What is wider than high then lies in them turned by a quarter counterclockwise, with the
    /// flag that turns it back; the first picture of a recording (of a capture clock) decides that for all of it.
    /// Never null: a source that can't capture reports a failure after its start.
    virtual std::shared_ptr<DisplayCaptureSource> makeSource(Size captureSize, MediaTime minimumInterval) = 0;
};

/// Which layers the display clone shows; what capture sources capture. Takes effect at the next start of a source, and
/// for a running source within a few frames. Callable from any lane; does not block.
class DisplayCloneControl {
public:
    static constexpr int kOff = 0;
    static constexpr int kMirrorDisplay = 1;
    static constexpr int kCloneContexts = 3;

    virtual ~DisplayCloneControl() = default;
    virtual void setMirroringMode(int mode) = 0;
    virtual void setContexts(const std::set<ContextID>& contexts) = 0;
};

}  // namespace lumacast
