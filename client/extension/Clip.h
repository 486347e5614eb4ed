#pragma once
// One clip of a broadcast in clip mode, and what an extension answers to it.

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/Value.h"
#include "broadcast/LCBroadcastConfiguration.h"
#include "linux/ipc/Fd.h"

namespace lumacast {
struct ExtensionItem;
}

namespace lumacast::extension {

/// What an extension may impose on the broadcast: the clips' length in seconds (0: the daemon's own) and how pictures are
/// compressed. The length governs the next cut; the clip being recorded is compressed as it began.
using BroadcastConfiguration = LCBroadcastConfiguration;

class HostLink;
class World;

/// The answer to one clip. Given when the object is destroyed, on whatever thread; until then the daemon keeps the clip's
/// file. Eight clips may be without an answer at a time; the daemon refuses to hand over more. Not thread-safe.
class ClipAnswer {
public:
    ClipAnswer(std::shared_ptr<World> world, std::weak_ptr<HostLink> host, std::int64_t request);
    ClipAnswer(ClipAnswer&& other) noexcept;
    ClipAnswer& operator=(ClipAnswer&& other) noexcept;
    ClipAnswer(const ClipAnswer&) = delete;
    ClipAnswer& operator=(const ClipAnswer&) = delete;
    ~ClipAnswer();

    /// Asks for another configuration. False when it can't be archived (more than 64 KiB); nothing is asked for then.
    bool setConfiguration(const BroadcastConfiguration& configuration);
    /// Hands the broadcasting application a dictionary.
    void setServiceInfo(Dictionary info);
    /// The clip was not taken: the daemon keeps its file until it purges old ones. What was set is not sent.
    void fail(Error error);

private:
    void give();

    std::shared_ptr<World> world_;  ///< null when the answer was given or moved away
    std::weak_ptr<HostLink> host_;
    std::int64_t request_ = 0;
    std::vector<ExtensionItem> items_;
    std::optional<Error> error_;
};

/// A finished movie: ordinary MP4, H.264, up to two AAC tracks (the first the application's sound, the second kept for
/// the microphone, which this version never records), its times beginning at zero.
struct Clip {
    Fd movie;         ///< to read; stays readable when the daemon has removed the file. At the file's beginning
    std::string url;  ///< the file as the daemon names it; its last component is different for each clip of the device
    std::uint64_t number = 0;            ///< counted from 1 in this process, missed ones included
    std::optional<Dictionary> userInfo;  ///< what the application set the broadcast up with, if anything
    bool isLast = false;                 ///< the broadcast ends with it
    ClipAnswer answer;
};

}  // namespace lumacast::extension
