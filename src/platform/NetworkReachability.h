#pragma once
#include <cstdint>
#include <optional>
#include <string>

namespace lumacast {

/// What the network's own tables say about the way to a host.
class NetworkReachability {
public:
    static constexpr std::uint32_t kReachable = 2;
    /// A connection must be brought up first.
    static constexpr std::uint32_t kConnectionRequired = 4;

    virtual ~NetworkReachability() = default;
    /// The flags of the way to the host now; none when they can't be read. Sends the host nothing. Waits at most a
    /// second, for the resolver; not for the request lane.
    virtual std::optional<std::uint32_t> flags(const std::string& hostName) = 0;
};

}  // namespace lumacast
