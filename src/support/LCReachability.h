#pragma once
#include "platform/NetworkReachability.h"

namespace lumacast {

/// Whether the device reaches the internet as it is now.
class LCReachability {
public:
    explicit LCReachability(NetworkReachability& network) : network_(network) {}

    /// `isNetworkAvailable` — by the flags of the way to a well-known host; false when they can't be read. Waits as long
    /// as the role does.
    bool isNetworkAvailable() const;

private:
    NetworkReachability& network_;
};

}  // namespace lumacast
