#pragma once
#include "base/Guarded.h"
#include "platform/NetworkReachability.h"

namespace lumacast {

/// A network in the state the test says; unreadable at first. Thread-safe.
class FakeNetworkReachability final : public NetworkReachability {
public:
    std::optional<std::uint32_t> flags(const std::string& hostName) override {
        hostName_.set(hostName);
        return flags_.get();
    }
    void setFlags(std::optional<std::uint32_t> flags) { flags_.set(flags); }
    /// Which host was asked for last.
    std::string hostName() const { return hostName_.get(); }

private:
    Guarded<std::optional<std::uint32_t>> flags_;
    Guarded<std::string> hostName_;
};

}  // namespace lumacast
