#pragma once
// What a microphone hears, as samples of a recording.

#include <cstdint>
#include <span>
#include <vector>

#include "linux/audio/SoundTimeline.h"
#include "platform/CaptureClock.h"
#include "writer/media/AudioFormat.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast::sound {

/// The format of every microphone sample: 44100 Hz, one channel, 16 bits, big-endian like the application's sound.
AudioFormat microphoneFormat();

/// Samples of what was heard from frame `first` of `timeline` on, mono, full scale 1, stamped with `clock`, in order:
/// one where the clock ran all the time, one for each run of it otherwise; what was heard while it stood is in none.
/// Cut to 32 frames, so a stamp is at most that much late.
std::vector<SampleRef> stampedSamples(const CaptureClock& clock, const SoundTimeline& timeline, std::int64_t first,
                                      std::span<const float> heard);

}  // namespace lumacast::sound
