#include "support/LCReachability.h"

namespace lumacast {

namespace {

/// A host that stays; by name, so that the answer says whether names can be resolved too.
constexpr char kProbeHost[] = "example.com";

}  // namespace

bool LCReachability::isNetworkAvailable() const {
    const auto flags = network_.flags(kProbeHost);
    return flags && (*flags & NetworkReachability::kReachable) && !(*flags & NetworkReachability::kConnectionRequired);
}

}  // namespace lumacast
