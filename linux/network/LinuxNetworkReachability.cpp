#include "linux/network/LinuxNetworkReachability.h"

#include <algorithm>

#include "linux/network/RoutingTable.h"

namespace lumacast {

namespace {

constexpr std::size_t kLongestName = 253;  // RFC 1035, 2.3.4, as text

bool isHostName(const std::string& name) {
    return !name.empty() && name.size() <= kLongestName &&
           std::all_of(name.begin(), name.end(), [](char c) { return c > ' ' && c < 0x7f; });
}

/// Kept for documentation, so that nobody has a route to them but that for everything (RFC 5737, RFC 3849).
std::vector<NetworkAddress> somewhere() {
    std::vector<NetworkAddress> addresses;
    for (const char* text : {"192.0.2.1", "2001:db8::1"})
        if (const auto address = NetworkAddress::parse(text)) addresses.push_back(*address);
    return addresses;
}

/// The best way to any of the addresses; none when the table can't be read.
std::optional<Way> bestWay(const std::vector<NetworkAddress>& addresses) {
    RoutingTable table;
    Way best = Way::None;
    for (const NetworkAddress& address : addresses) {
        const auto way = table.wayTo(address);
        if (!way) return std::nullopt;
        best = std::max(best, *way);
        if (best == Way::Usable) break;
    }
    return best;
}

}  // namespace

std::optional<std::uint32_t> LinuxNetworkReachability::flags(const std::string& hostName) {
    using Addresses = std::vector<NetworkAddress>;
    if (!isHostName(hostName)) return std::nullopt;
    const Addresses addresses =
        resolver_
            .ask<Addresses>(options_.patience, [resolve = options_.resolve, hostName] { return resolve(hostName); })
            .value_or(Addresses{});
    std::optional<Way> way = bestWay(addresses.empty() ? somewhere() : addresses);
    // A way to anywhere is none to a host that nobody knows; a connection that is to be made may help with that.
    if (addresses.empty() && way == Way::Usable) way = Way::None;
    if (!way) return std::nullopt;
    switch (*way) {
        case Way::Usable: return kReachable;
        case Way::NeedsConnection: return kReachable | kConnectionRequired;
        case Way::None: break;
    }
    return 0;
}

}  // namespace lumacast
