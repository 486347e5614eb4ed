#pragma once
// All that one process plays, heard: its streams as they come and go.

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <vector>

#include "linux/audio/PulseConnection.h"
#include "linux/audio/ServerReader.h"
#include "linux/audio/TapMix.h"
#include "linux/audio/TapOwner.h"
#include "linux/audio/TappedStream.h"

namespace lumacast::sound {

/// Keeps a TappedStream for each stream of the process, into one mix. It looks at the server's lists whenever one of
/// them has changed, at most twenty times a second, and again after each stream it made: only when the list then says
/// that the stream is still the process's and that ours hangs on it is it trusted. Belongs to the sound thread.
class ProcessTap final : public PulseUser {
public:
    ProcessTap(std::shared_ptr<TapOwner> owner, std::shared_ptr<TapMix> mix)
        : owner_(std::move(owner)), mix_(std::move(mix)) {}

    void serverCame(const PulseServer& server) override;
    void serverWent() override;
    pa_subscription_mask_t interest() const override;
    void serverChanged(pa_subscription_event_type_t event, std::uint32_t index) override;

private:
    /// What is there while a server is.
    struct Connected {
        Connected(ProcessTap& tap, const PulseServer& server);
        const PulseServer server;
        ServerReader reader;
        PulseTimer soon, retry;
        std::vector<std::unique_ptr<TappedStream>> streams;
        /// How often a stream could not be tapped in a row, and when it is tried again.
        struct Failure {
            int count = 0;
            std::chrono::steady_clock::time_point notBefore;
        };
        std::map<std::uint32_t, Failure> failures;
        std::chrono::steady_clock::time_point lastLook;
        bool isStale = false;  ///< something has changed since the reading began
    };

    void look();
    void lookSoon();
    void took(const ServerListing* listing);
    void judge(const ServerListing& listing, const std::vector<ListedPlayback>& wanted);
    void open(TappedStream::Account account, const std::vector<ListedPlayback>& wanted);

    const std::shared_ptr<TapOwner> owner_;
    const std::shared_ptr<TapMix> mix_;
    std::unique_ptr<Connected> connected_;
};

}  // namespace lumacast::sound
