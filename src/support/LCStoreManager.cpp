#include "support/LCStoreManager.h"

#include <utility>

namespace lumacast {

void LCStoreManager::loadItemDetailsForBundleIdentifier(const BundleIdentifier& identifier, Handler completionHandler) {
    const StoreRequest request{.bundleIdentifiers = {identifier.text()}};
    platform_.storeLookup.start(
        request, [&localization = localization_, &main = platform_.scheduler.mainQueue(), identifier,
                  completionHandler = std::move(completionHandler)](const std::vector<StoreProduct>& products) {
            const StoreProduct product = products.empty() ? StoreProduct{} : products.front();
            LCStoreInfo info;
            info.bundleID = identifier;
            info.appName = product.displayName;
            if (!info.appName) info.appName = localization._lcLocalizedAppNameFromBundleID(identifier);
            info.author = product.artistName.value_or("");
            info.itemURL = product.shortProductURL.value_or("");
            info.categories = product.genreNames;
            main.async([info = std::move(info), completionHandler] { completionHandler(info); });
        });
}

}  // namespace lumacast
