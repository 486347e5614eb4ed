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
    std::string_view meaning;
    LimitKeeper keeper = LimitKeeper::Connections;
};

/// In the order of the enumeration.
inline constexpr std::array kLimits{
    LimitRow{Limit::MessageBytes, 1 << 20, "bytes of one message on the wire"},
    LimitRow{Limit::MessageDepth, 16, "arrays and dictionaries nested in one message"},
    LimitRow{Limit::HandlesPerMessage, 8, "descriptors that travel with one message"},
    LimitRow{Limit::ConnectionsPerUser, 1200, "open connections of one user"},
    LimitRow{Limit::MessagesInFlight, 64, "requests of one connection that wait for their reply"},
    LimitRow{Limit::QueuedBytesPerReader, 4 << 20, "bytes waiting for one peer that does not read"},
    LimitRow{Limit::ContextIdentifiersPerRequest, 64, "window layers named in one start request"},
    LimitRow{Limit::HelloBytes, 64, "bytes a peer may send before its hello is complete"},
    LimitRow{Limit::PlanesLeased, 4, "planes lent to one peer at a time"},
    LimitRow{Limit::MessageValues, 16'384, "values in one message, at all depths"},
    LimitRow{Limit::HeldBytesPerUser, 64 << 20, "bytes of unfinished and of unread messages of one user's connections"},
    LimitRow{Limit::ConnectionsBeforeHello, 64, "connections of one user that have not said hello"},
    LimitRow{Limit::RequestsWithoutReply, 1024, "requests of one connection known to get no reply, kept until it ends"},
    LimitRow{Limit::StartsWaitingForUser, 32, "start requests that wait for the user's answer",
             LimitKeeper::Manager},
    LimitRow{Limit::StartsOfApplicationWaitingForUser, 4,
             "start requests of one application that wait for the user's answer", LimitKeeper::Manager},
    LimitRow{Limit::ArchiveBytes, 64 << 10, "bytes of one keyed archive", LimitKeeper::Archives},
    LimitRow{Limit::ArchiveDepth, 8, "arrays and dictionaries nested in one keyed archive", LimitKeeper::Archives},
    LimitRow{Limit::ExtensionsInstalled, 256, "installed extensions that are looked at", LimitKeeper::Extensions},
    LimitRow{Limit::ExtensionItemsReturned, 16, "items that an extension returns for one request",
             LimitKeeper::Extensions},
    LimitRow{Limit::ExtensionRequestsInFlight, 8, "requests of one extension that it has not completed",
             LimitKeeper::Extensions},
    LimitRow{Limit::FramesAtExtension, 3, "frames that one extension has and has not processed",
             LimitKeeper::ExtensionProxy},
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
