#pragma once
// What an extension gets in sample mode.

#include <cstdint>
#include <memory>

#include "base/Value.h"
#include "writer/media/AudioFormat.h"
#include "writer/media/PixelBuffer.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast::extension {

/// Keeps one payload from counting as processed. Copies share it: the payload is processed when the last one is destroyed,
/// on whatever thread, which never blocks. Released after run() has returned it does nothing.
///
/// The daemon lets an extension have three frames at a time and leaves out further ones, so hold on to one for as long as
/// it is worth a frame. Of all payloads together 64 may be under way; one more ends the broadcast.
using Completion = std::shared_ptr<void>;

/// The picture as it was captured.
struct Frame {
    /// BGRX in memory that is shared with the daemon, never copied: read-only, and unchanging while it is held. Never
    /// null, and its pixels are there. Holding it also keeps the frame from counting as processed.
    std::shared_ptr<const SharedPlane> plane;
    /// How the picture is to be turned for showing, as EXIF numbers it: 1 (as it is) to 8.
    std::uint32_t orientation = 1;
    /// Presentation times rise from frame to frame, in the time that the sounds share: of the recording's own clock,
    /// zero at its first picture, 1,000,000,000 ticks a second, and standing in a pause.
    SampleTiming timing;
    Completion completion;
};

/// A stretch of uncompressed sound.
struct Sound {
    enum class Source { Application, Microphone };
    Source source = Source::Application;  ///< never the microphone in this version
    AudioFormat format;       ///< linear PCM; rate, channels and sizes make sense
    Data bytes;               ///< at least frames * format.bytesPerFrame
    std::int64_t frames = 0;  ///< one sample of each channel
    SampleTiming timing;      ///< when the first frame was played, and how long they all last; the frames' clock
    Completion completion;
};

}  // namespace lumacast::extension
