#pragma once
#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace lumacast {

/// The address of a host. A value.
struct NetworkAddress {
    int family = 0;                        ///< AF_INET or AF_INET6
    std::array<std::uint8_t, 16> bytes{};  ///< in network order; AF_INET uses the first four

    std::size_t length() const;
    /// From "192.0.2.1" or "2001:db8::1"; none for anything else.
    static std::optional<NetworkAddress> parse(const std::string& text);
    bool operator==(const NetworkAddress&) const = default;
};

/// The first 16 addresses that the system's resolver knows for a host's name; none when it knows none, or can't tell.
/// Blocks as long as the resolver does.
std::vector<NetworkAddress> resolveBySystem(const std::string& hostName);

}  // namespace lumacast
