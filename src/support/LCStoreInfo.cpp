#include "support/LCStoreInfo.h"

namespace lumacast {

Dictionary LCStoreInfo::dictionary() const {
    Dictionary entries;
    if (bundleID) entries.set("LCStoreInfoBundleIDKey", bundleID->text());
    if (appName) entries.set("LCStoreInfoAppNameKey", *appName);
    if (author) entries.set("LCStoreInfoAuthorKey", *author);
    if (itemURL) entries.set("LCStoreInfoItemURLKey", *itemURL);
    if (categories && !categories->empty()) {
        std::string joined;
        for (const std::string& category : *categories) joined += (joined.empty() ? "" : ",") + category;
        entries.set("LCStoreInfoCategoriesKey", joined);
    }
    return entries;
}

}  // namespace lumacast
