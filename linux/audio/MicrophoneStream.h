#pragma once
// A recording of one microphone.

#include <cstdint>
#include <functional>
#include <span>
#include <vector>

#include "linux/audio/MicrophoneReader.h"
#include "linux/audio/MixDown.h"
#include "linux/audio/PulseConnection.h"
#include "linux/audio/SoundTimeline.h"
#include "linux/audio/StreamOrigin.h"
#include "linux/audio/StreamPosition.h"

namespace lumacast::sound {

/// Records from one source of the server and from no other: where the source goes, the stream ends. Belongs to the
/// sound thread.
class MicrophoneStream final {
public:
    /// Mono, full scale 1; the first one is frame `first` of the timeline.
    using Heard = std::function<void(std::int64_t first, std::span<const float> samples)>;

    /// `changed` is told when the stream has ended by itself, and when its source is suspended or resumed. Neither may
    /// destroy the stream.
    MicrophoneStream(const PulseServer& server, const ListedMicrophone& microphone, const SoundTimeline& timeline,
                     Heard heard, std::function<void()> changed);
    MicrophoneStream(const MicrophoneStream&) = delete;
    MicrophoneStream& operator=(const MicrophoneStream&) = delete;

    /// The server's number of the source.
    std::uint32_t source() const { return source_; }
    bool hasEnded() const { return state_ == State::Ended; }
    bool isSuspended() const;

private:
    enum class State { Connecting, Ready, Ended };

    void stateChanged();
    void end();
    void askWhen();
    void timingCame();
    void took(HostTime origin);
    void hear();
    void takeIn();

    const std::uint32_t source_;
    /// PulseAudio knows at any time what was heard. PipeWire counts only what it has delivered, in pieces of many
    /// milliseconds: its account is right when one has just come, and late otherwise.
    const bool countsPieces_;
    const SoundTimeline timeline_;
    const Heard heard_;
    const std::function<void()> changed_;
    const MixDown mixDown_;
    StreamPosition position_;
    pa_sample_spec format_{};
    State state_ = State::Connecting;
    StreamOrigin origin_;
    HostTime zero_;             ///< when the recording's first frame was heard, as far as we know
    std::int64_t latency_ = 0;  ///< in microseconds: of what has come, by the server's last account
    HostTime lastHeard_;        ///< when sound came last
    bool isAsking_ = false;
    std::vector<float> mixed_;
    StreamHandle stream_;
};

}  // namespace lumacast::sound
