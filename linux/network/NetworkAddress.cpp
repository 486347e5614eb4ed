#include "linux/network/NetworkAddress.h"

#include <arpa/inet.h>
#include <netdb.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <algorithm>
#include <cstring>
#include <memory>

namespace lumacast {

namespace {

constexpr std::size_t kMostAddresses = 16;

struct FreeAddresses {
    void operator()(addrinfo* list) const { ::freeaddrinfo(list); }
};

std::optional<NetworkAddress> addressIn(const sockaddr& address) {
    NetworkAddress found{address.sa_family, {}};
    if (address.sa_family == AF_INET) {
        std::memcpy(found.bytes.data(), &reinterpret_cast<const sockaddr_in&>(address).sin_addr, found.length());
    } else if (address.sa_family == AF_INET6) {
        std::memcpy(found.bytes.data(), &reinterpret_cast<const sockaddr_in6&>(address).sin6_addr, found.length());
    } else {
        return std::nullopt;
    }
    return found;
}

}  // namespace

std::size_t NetworkAddress::length() const {
    return family == AF_INET ? sizeof(in_addr) : sizeof(in6_addr);
}

std::optional<NetworkAddress> NetworkAddress::parse(const std::string& text) {
    NetworkAddress address;
    for (const int family : {AF_INET, AF_INET6}) {
        address.family = family;
        if (::inet_pton(family, text.c_str(), address.bytes.data()) == 1) return address;
    }
    return std::nullopt;
}

std::vector<NetworkAddress> resolveBySystem(const std::string& hostName) {
    addrinfo wanted{};
    wanted.ai_family = AF_UNSPEC;
    wanted.ai_socktype = SOCK_STREAM;
    addrinfo* list = nullptr;
    if (::getaddrinfo(hostName.c_str(), nullptr, &wanted, &list) != 0) return {};
    const std::unique_ptr<addrinfo, FreeAddresses> owned(list);
    std::vector<NetworkAddress> addresses;
    for (const addrinfo* entry = list; entry && addresses.size() < kMostAddresses; entry = entry->ai_next)
        if (const auto address = entry->ai_addr ? addressIn(*entry->ai_addr) : std::nullopt)
            addresses.push_back(*address);
    return addresses;
}

}  // namespace lumacast
