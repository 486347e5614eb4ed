#pragma once
// Which of the server's streams belong to a process: decided from what the server says, without asking anybody.

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/Identifiers.h"

namespace lumacast::sound {

/// What the server calls "none".
inline constexpr std::uint32_t kNoIndex = 0xffffffff;

/// What is taken from a server at most; the rest is not looked at. Whoever may connect to it can make it long.
inline constexpr std::size_t kMostListed = 1024;
inline constexpr std::size_t kMostTapped = 16;
inline constexpr std::size_t kMostPropertyBytes = 256;
inline constexpr std::size_t kMostChannels = 32;

/// Positions of channels, in the servers' numbering.
inline constexpr std::int32_t kFrontLeft = 1, kFrontRight = 2;

/// Whose process a client of the server is.
struct ClientIdentity {
    ProcessID pid{0};
    /// The kernel told the server. Otherwise the client said so itself, and the following with it.
    bool isKernelChecked = false;
    std::string binary;   ///< the file name of its program
    std::string machine;  ///< the machine's identifier
    bool operator==(const ClientIdentity&) const = default;
};

/// A client as the server lists it.
struct ListedClient {
    std::uint32_t index = kNoIndex;
    std::optional<std::int32_t> kernelPid;   ///< of whoever holds the connection to PipeWire
    std::optional<std::int32_t> claimedPid;
    std::string binary, machine;
    bool isRemote = false;                   ///< not over a local socket: its numbers are another machine's
};

/// Reads the properties of a client; `property` answers one by name, or none.
ListedClient readClient(std::uint32_t index,
                        const std::function<std::optional<std::string_view>(std::string_view name)>& property);

/// A stream that an application plays.
struct ListedPlayback {
    std::uint32_t index = kNoIndex, client = kNoIndex, sink = kNoIndex;
    std::vector<std::int32_t> positions;  ///< of its channels, in the server's numbering
    bool operator==(const ListedPlayback&) const = default;
};
/// An output of the machine, and the source that repeats all it plays.
struct ListedSink {
    std::uint32_t index = kNoIndex, monitorSource = kNoIndex;
};
/// A stream that somebody records.
struct ListedRecording {
    std::uint32_t index = kNoIndex, client = kNoIndex, source = kNoIndex;
};

/// What the server listed, more or less at one moment.
struct ServerListing {
    bool isPipeWire = false;
    std::uint32_t ownClient = kNoIndex;  ///< as the server told us when we connected
    std::vector<ListedClient> clients;
    std::vector<ListedPlayback> playbacks;
    std::vector<ListedSink> sinks;
    std::vector<ListedRecording> recordings;
};

/// Whose process the client is, as far as the server can be believed; none where there is any doubt.
/// Behind PipeWire's PulseAudio service every client's connection is the service's own, ours too: only then what the
/// client says of itself is looked at. With PulseAudio there is nothing else.
std::optional<ClientIdentity> identityOf(const ServerListing& listing, const ListedClient& client);

/// The streams to be tapped: those whose client `belongs`, at most kMostTapped, oldest first, with the channels that are
/// to be recorded.
std::vector<ListedPlayback> selectPlaybacks(const ServerListing& listing,
                                            const std::function<bool(const ListedClient&, const ClientIdentity&)>& belongs);

/// Whether our stream `recording` can only be hearing `playback`, judged by where the server says that it is connected.
bool isConnected(const ServerListing& listing, const ListedPlayback& playback, std::uint32_t recording);

}  // namespace lumacast::sound
