#pragma once
// What the store says about applications.

#include <functional>
#include <string>
#include <vector>

#include <optional>

namespace lumacast {

/// What is asked of the store.
struct StoreRequest {
    enum class KeyProfile : int { Product };

    KeyProfile keyProfile = KeyProfile::Product;  ///< one product per result
    int localizationStyle = 1;                    ///< 1: results in the device's language
    std::vector<std::string> bundleIdentifiers;
};

/// One product. What the store does not say is none.
struct StoreProduct {
    std::optional<std::string> displayName, artistName, shortProductURL;
    std::optional<std::vector<std::string>> genreNames;
};

class StoreLookup {
public:
    /// Empty when nothing was found or the lookup failed. The order says nothing.
    using Handler = std::function<void(const std::vector<StoreProduct>&)>;

    virtual ~StoreLookup() = default;
    /// Looks products up and calls the handler once, from a lane of the platform's, never inline. Callable from any
    /// lane; does not block.
    virtual void start(const StoreRequest& request, Handler handler) = 0;
};

}  // namespace lumacast
