#pragma once
#include <functional>

#include "platform/Platform.h"
#include "support/LCStoreInfo.h"
#include "support/Localization.h"

namespace lumacast {

/// Describes applications by their entries in the store. One for the process. Callable from any lane; does not block.
class LCStoreManager {
public:
    using Handler = std::function<void(const LCStoreInfo&)>;

    /// Both are borrowed and outlive the lookups.
    LCStoreManager(const Platform& platform, Localization& localization)
        : platform_(platform), localization_(localization) {}

    /// `loadItemDetailsForBundleIdentifier:completionHandler:` — the handler is called exactly once, on the main queue,
    /// never inline. What the store does not say, or a lookup that failed, leaves the application's local name and
    /// nothing else.
    void loadItemDetailsForBundleIdentifier(const BundleIdentifier& identifier, Handler completionHandler);

private:
    const Platform platform_;
    Localization& localization_;
};

}  // namespace lumacast
