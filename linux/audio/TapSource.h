#pragma once
// Where taps and microphones get their sound from.

#include <functional>
#include <memory>
#include <span>

#include "base/Identifiers.h"
#include "linux/audio/SoundTimeline.h"
#include "linux/audio/TapMix.h"

namespace lumacast::sound {

/// Listening to something; letting go of it ends that. On any thread, and it waits for nobody.
class Listening {
public:
    virtual ~Listening() = default;
};

/// One process, held so that its number can't become another's.
class TappedProcess {
public:
    virtual ~TappedProcess() = default;
    /// From now on what it plays goes into `mix`. Null when the system has no thread left. Waits for nobody.
    virtual std::unique_ptr<Listening> listen(std::shared_ptr<TapMix> mix) = 0;
};

/// What the processes of this machine play. Callable from any thread.
class TapSource {
public:
    virtual ~TapSource() = default;
    /// Null for a process that does not run. May take a moment, where it has to be found out what the process is.
    virtual std::shared_ptr<TappedProcess> hold(ProcessID pid) = 0;
    /// From now on nothing is heard any more, and nobody is asked anything.
    virtual void end() {}
};

/// Told what a microphone hears, on a thread of the microphone's; neither may wait.
struct MicrophoneListener {
    /// Frames that follow each other in time, from frame `first` of the timeline on; mono, full scale 1.
    std::function<void(const SoundTimeline& timeline, std::int64_t first, std::span<const float> samples)> heard;
    /// That the microphone is interrupted (it is suspended, taken, silent since it was heard, or gone since then),
    /// and that it is heard again; in turns, the latter before the sound.
    std::function<void(bool isInterrupted)> interrupted;
};

/// Opens the default microphone. Null when the system has no thread left. Waits for nobody.
using OpenMicrophone = std::function<std::unique_ptr<Listening>(MicrophoneListener listener)>;

}  // namespace lumacast::sound
