#pragma once
// The user's keys to display servers.

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace lumacast::x11 {

/// A key as the server wants to see it.
struct AuthorityKey {
    std::string method;
    std::vector<std::uint8_t> secret;
    bool operator==(const AuthorityKey&) const = default;
};

/// The key of this machine's display `number` ("0") in the contents of an authority file, or none. The file is a row of
/// entries: family (16 bits), address, number, method, secret (each its length in 16 bits, then its bytes), all
/// big-endian. What follows a broken entry is not looked at. Pure.
std::optional<AuthorityKey> findKey(std::span<const std::uint8_t> file, std::string_view host, std::string_view number);

/// The same from the user's file ($XAUTHORITY, else .Xauthority in the home directory). The protocol library's own
/// reader isn't thread-safe, and several lanes connect.
std::optional<AuthorityKey> userKey(std::string_view number);

}  // namespace lumacast::x11
