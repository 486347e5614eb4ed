#pragma once
// Every quantity that a peer controls, and its limit: the one table.

#include <array>
#include <cstdint>
#include <string_view>

namespace lumacast {

enum class Limit : std::uint8_t {
    MessageBytes,
    MessageDepth,
    HandlesPerMessage,
    ConnectionsPerUser,
    MessagesInFlight,
    QueuedBytesPerReader,
    ContextIdentifiersPerRequest,
    HelloBytes,
    PlanesLeased,
    MessageValues,
    HeldBytesPerUser,
    ConnectionsBeforeHello,
    RequestsWithoutReply,
    StartsWaitingForUser,
    StartsOfApplicationWaitingForUser,
    ArchiveBytes,
    ArchiveDepth,
    ExtensionsInstalled,
    ExtensionItemsReturned,
    ExtensionRequestsInFlight,
    FramesAtExtension,
};

/// Who refuses what goes beyond it.
enum class LimitKeeper : std::uint8_t { Connections, Manager, Archives, Extensions, ExtensionProxy };

struct LimitRow {
    Limit limit;
    std::uint64_t value;
    std::string_view meaning;  ///< begins with its unit
    std::string_view beyond;   ///< what becomes of what goes beyond it
    LimitKeeper keeper = LimitKeeper::Connections;
};

/// In the order of the enumeration.
inline constexpr std::array kLimits{
    LimitRow{Limit::MessageBytes, 1 << 20, "bytes of one message on the wire",
             "it is not sent (EMSGSIZE); who sends it is dropped"},
    LimitRow{Limit::MessageDepth, 16, "arrays and dictionaries nested in one message",
             "it is not sent (EMSGSIZE); who sends it is dropped"},
    LimitRow{Limit::HandlesPerMessage, 8, "descriptors that travel with one message",
             "it is not sent (EMSGSIZE); who sends it is dropped"},
    LimitRow{Limit::ConnectionsPerUser, 1200, "open connections of one user",
             "the new one is closed"},
    LimitRow{Limit::MessagesInFlight, 64, "requests of one connection that wait for their reply",
             "the next one is not sent (EAGAIN); who sends it is dropped"},
    LimitRow{Limit::QueuedBytesPerReader, 4 << 20, "bytes waiting for one peer that does not read",
             "a message to it fails (ENOBUFS); a reply for which there is no room ends the connection"},
    LimitRow{Limit::ContextIdentifiersPerRequest, 64, "window layers named in one start request",
             "it is not sent (EINVAL); who sends it is dropped"},
    LimitRow{Limit::HelloBytes, 64, "bytes a peer may send before its hello is complete",
             "it is dropped"},
    LimitRow{Limit::PlanesLeased, 4, "planes lent to one peer at a time",
             "the next one is not sent (EAGAIN): that frame is left out"},
    LimitRow{Limit::MessageValues, 16'384, "values in one message, at all depths",
             "it is not sent (EMSGSIZE); who sends it is dropped"},
    LimitRow{Limit::HeldBytesPerUser, 64 << 20, "bytes of unfinished and of unread messages of one user's connections",
             "a message to it fails (ENOBUFS); the connection whose message goes beyond is dropped"},
    LimitRow{Limit::ConnectionsBeforeHello, 64, "connections of one user that have not said hello",
             "the oldest of the process that has the most of them is dropped"},
    LimitRow{Limit::RequestsWithoutReply, 1024, "requests of one connection known to get no reply, kept until it ends",
             "the oldest one is told that there will be none (ENODATA)"},
    LimitRow{Limit::StartsWaitingForUser, 32, "start requests that wait for the user's answer",
             "refused: RECORDING_ERROR_FAILED_TO_START", LimitKeeper::Manager},
    LimitRow{Limit::StartsOfApplicationWaitingForUser, 4,
             "start requests of one application that wait for the user's answer",
             "refused: RECORDING_ERROR_FAILED_TO_START", LimitKeeper::Manager},
    LimitRow{Limit::ArchiveBytes, 64 << 10, "bytes of one keyed archive",
             "no archive is made; one that comes is none", LimitKeeper::Archives},
    LimitRow{Limit::ArchiveDepth, 8, "arrays and dictionaries nested in one keyed archive",
             "no archive is made; one that comes is none", LimitKeeper::Archives},
    LimitRow{Limit::ExtensionsInstalled, 256, "installed extensions that are looked at",
             "the others are passed over, with a line in the log", LimitKeeper::Extensions},
    LimitRow{Limit::ExtensionItemsReturned, 16, "items that an extension returns for one request",
             "the others are left out, with a line in the log", LimitKeeper::Extensions},
    LimitRow{Limit::ExtensionRequestsInFlight, 8, "requests of one extension that it has not completed",
             "the next one fails (EAGAIN): the clip stays for the purge", LimitKeeper::Extensions},
    LimitRow{Limit::FramesAtExtension, 3, "frames that one extension has and has not processed",
             "it does not get the next frame", LimitKeeper::ExtensionProxy},
};

/// How little space may be free where movies are written before temporary ones are asked for.
struct PurgeLevel {
    std::int32_t urgency;
    std::uint64_t freeBytesBelow;
    std::string_view meaning;
};

/// The most urgent last.
inline constexpr std::array kPurgeLevels{
    PurgeLevel{1, 1'000'000'000, "space gets short: old movies may go"},
    PurgeLevel{2, 500'000'000, "space is short"},
    PurgeLevel{3, 100'000'000, "less than a recording may begin with: a running one is stopped, every movie goes"},
};

constexpr std::uint64_t limitOf(Limit limit) { return kLimits[static_cast<std::size_t>(limit)].value; }

}  // namespace lumacast
