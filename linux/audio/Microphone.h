#pragma once
// The default microphone, for as long as somebody wants to hear it.

#include <memory>
#include <span>

#include "linux/audio/MicrophoneReader.h"
#include "linux/audio/MicrophoneStream.h"
#include "linux/audio/PulseConnection.h"
#include "linux/audio/SoundTimeline.h"
#include "linux/audio/TapSource.h"

namespace lumacast::sound {

/// While it is attached to the connection it records from the server's default source, follows the user's choice of it,
/// and comes back when server or source come back. While a telephone call records from that source it lets go of it.
/// Made on any thread; everything else is the sound thread's, and so are both functions: neither may wait.
class Microphone final : public PulseUser {
public:
    /// Its timeline begins now.
    explicit Microphone(MicrophoneListener listener);

    void serverCame(const PulseServer& server) override;
    void serverWent() override;
    pa_subscription_mask_t interest() const override;
    void serverChanged(pa_subscription_event_type_t event, std::uint32_t index) override;

private:
    /// What exists only while there is a server.
    struct Session {
        Session(const PulseServer& server, Microphone& microphone);
        PulseServer server;
        MicrophoneReader reader;
        PulseTimer again;  ///< to look at the stream outside of its calls, or once more after a failure
        PulseTimer watch;
        std::unique_ptr<MicrophoneStream> stream;
        bool isOutdated = false;   ///< something changed while the reader read
        bool mustRead = false;     ///< whatever the stream does
        bool isUndecided = false;  ///< the last reading was, and nothing tells when that has changed
    };

    void read();
    void decide(const ListedMicrophone* microphone);
    void look();
    void watch();
    void closeStream();
    void heard(std::int64_t first, std::span<const float> samples);
    void setInterrupted(bool isInterrupted);

    const MicrophoneListener listener_;
    const SoundTimeline timeline_;
    std::int64_t next_ = 0;      ///< the frame after the last one that was handed over
    bool wasHeard_ = false;
    bool isInterrupted_ = false;
    int silentWatches_ = 0;      ///< since sound came last
    std::unique_ptr<Session> session_;
};

}  // namespace lumacast::sound
