#pragma once
// One stream of the process, heard.

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <vector>

#include "linux/audio/MixDown.h"
#include "linux/audio/PulseConnection.h"
#include "linux/audio/StreamOrigin.h"
#include "linux/audio/StreamPosition.h"
#include "linux/audio/TapMix.h"
#include "linux/audio/TapSelection.h"

namespace lumacast::sound {

/// Records one playback stream of the server into a lane of a mix. What it hears is not read by anybody before
/// trust(). Belongs to the sound thread.
class TappedStream final {
public:
    /// What the server's account of the time is worth. PulseAudio knows at any time what was heard. PipeWire counts only
    /// what it has delivered, in pieces of many milliseconds: it is right when one has just come, and late otherwise.
    enum class Account : std::uint8_t { AtAnyTime, AtEachPiece };

    /// `changed` is told when the stream has become ready and when it has ended by itself; it may not destroy the
    /// stream.
    TappedStream(const PulseServer& server, const ListedPlayback& playback, Account account,
                 std::shared_ptr<TapMix> mix, std::function<void()> changed);
    /// What was heard up to now and is trusted is still read.
    ~TappedStream();
    TappedStream(const TappedStream&) = delete;
    TappedStream& operator=(const TappedStream&) = delete;

    const ListedPlayback& playback() const { return playback_; }
    bool isReady() const { return state_ == State::Ready; }
    bool hasEnded() const { return state_ == State::Ended; }
    /// Whether it became ready after that moment.
    bool isNewerThan(std::chrono::steady_clock::time_point moment) const { return readySince_ > moment; }
    /// The server's number of the recording.
    std::uint32_t recording() const;
    void trust();
    /// Throws away whatever was heard and not read, and ends.
    void distrust();

private:
    enum class State { Connecting, Ready, Ended };

    void stateChanged();
    void end();
    void askWhen();
    void timingCame();
    void took(const StreamAccount& account);
    void hear();
    void takeIn();

    const ListedPlayback playback_;
    const Account account_;
    const std::shared_ptr<TapMix> mix_;
    const std::function<void()> changed_;
    const MixDown mixDown_;
    const std::shared_ptr<SoundLane> lane_;
    StreamPosition position_;
    State state_ = State::Connecting;
    std::chrono::steady_clock::time_point readySince_;
    pa_sample_spec format_{};
    StreamOrigin origin_;
    std::uint64_t latency_ = 0, delay_ = 0;  ///< by the server's last account
    HostTime lastHeard_;   ///< when sound came last
    bool isAsking_ = false;
    std::vector<float> mixed_;
    StreamHandle stream_;
};

}  // namespace lumacast::sound
