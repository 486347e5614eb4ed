#pragma once
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>

#include "extensions/live-push/MediaOutput.h"
#include "extensions/live-push/PacketQueue.h"
#include "extensions/live-push/PushSettings.h"

namespace lumacast::extensions {

enum class SenderState { Connecting, Live, Reconnecting, GivenUp, Ended };

/// Keeps a stream going: connects, sends, and connects again when the server has gone, on a thread of its own. Whoever
/// hands packets over never waits; what can't be sent in time is left out up to a key frame.
class Sender final {
public:
    struct Report {
        SenderState state = SenderState::Connecting;
        std::uint64_t pictures = 0;  ///< sent
        std::uint64_t leftOut = 0;   ///< pictures that were not, or not completely
        std::uint64_t reconnects = 0;
        std::int64_t bitRate = 0;  ///< bits a second, since the report before
        std::string lastFailure;   ///< empty before the first
    };
    struct Timing {
        std::chrono::milliseconds firstDelay{500},
            longestDelay{5000};  ///< between attempts to connect; doubled each time
        std::chrono::milliseconds betweenReports{2000};
        std::chrono::milliseconds patience{8000};  ///< with a server that takes nothing
    };

    /// `report` is called on the sender's thread at each change of state, and now and then in between; `wantsKeyFrame`
    /// likewise when a picture is needed that needs no other.
    Sender(PushSettings settings, Timing timing, std::function<void(const Report&)> report,
           std::function<void()> wantsKeyFrame);
    Sender(const Sender&) = delete;
    Sender& operator=(const Sender&) = delete;
    /// Gives up what was not sent.
    ~Sender();

    /// Once, before the first packet.
    void setTracks(StreamTracks tracks);
    void send(OutgoingPacket packet);
    /// Pictures that were left out before they came here.
    void countLeftOut(std::uint64_t pictures);
    /// Sends what waits and ends the stream. Waits for that at most `limit`.
    void finish(std::chrono::milliseconds limit);

private:
    using Clock = std::chrono::steady_clock;

    void run();
    bool connect(std::unique_ptr<MediaOutput>& output);
    void sendUntilFailure(MediaOutput& output);
    bool waitToTryAgain();
    void tell(SenderState state);
    void tellIfDue();
    bool isGivenUp() const;

    const PushSettings settings_;
    const Timing timing_;
    const std::function<void(const Report&)> report_;
    const std::function<void()> wantsKeyFrame_;

    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::optional<StreamTracks> tracks_;
    PacketQueue queue_;
    std::uint64_t leftOut_ = 0;
    bool isEnding_ = false, isGivenUp_ = false, isDone_ = false;

    // The thread's own.
    Report now_;
    std::uint64_t bytesSinceReport_ = 0;
    Clock::time_point lastReport_, lastLive_;
    std::chrono::milliseconds delay_;
    std::thread thread_;
};

}  // namespace lumacast::extensions
