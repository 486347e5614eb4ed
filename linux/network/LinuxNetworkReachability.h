#pragma once
#include <chrono>
#include <functional>
#include <string>
#include <vector>

#include "linux/network/NetworkAddress.h"
#include "linux/system/DiskLane.h"
#include "platform/NetworkReachability.h"

namespace lumacast {

/// The way to a host by the system's resolver and the kernel's routing table; see the folder's README for what the
/// flags mean here. Callable from any lane that may wait a second.
class LinuxNetworkReachability final : public NetworkReachability {
public:
    struct Options {
        /// The addresses of a host, empty when it has none; may hang. Owns what it touches.
        std::function<std::vector<NetworkAddress>(const std::string& hostName)> resolve = resolveBySystem;
        std::chrono::milliseconds patience{1000};  ///< with the resolver
    };

    LinuxNetworkReachability() : LinuxNetworkReachability(Options{}) {}
    explicit LinuxNetworkReachability(Options options) : options_(std::move(options)) {}

    std::optional<std::uint32_t> flags(const std::string& hostName) override;

private:
    const Options options_;
    DiskLane resolver_{2};
};

}  // namespace lumacast
