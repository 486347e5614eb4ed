#pragma once
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/Log.h"
#include "platform/AppExtension.h"
#include "support/Localization.h"

namespace lumacast {

/// The extension points of broadcasting: searched first, and the older one.
inline constexpr std::string_view kBroadcastUploadPoint = "com.orvane.broadcast-services-upload";
inline constexpr std::string_view kBroadcastServicesPoint = "com.orvane.broadcast-services";
/// The activation rule of an extension that declares streaming of its own.
inline constexpr std::string_view kSupportsStreamingRule = "ExtensionActivationSupportsLumacastStreaming";

/// A key that an extension's activation rule must have with a true value.
struct ActivationRule {
    std::string key;
};
/// A key whose true value keeps an extension out.
struct UnwantedActivationRule {
    std::string key;
};

/// Finds broadcast extensions: class operations of AppExtension, and one of its input items. The log and the platform's
/// extensions are borrowed.
class ExtensionDiscovery {
public:
    /// Runs on whatever lane the platform answers on; its error is passed on unchanged.
    using Completion = std::function<void(std::vector<std::shared_ptr<AppExtension>>, std::optional<Error>)>;

    ExtensionDiscovery(Log& log, AppExtensions& extensions) : log_(log), extensions_(extensions) {}

    /// `extensionsWithMatchingPointName:baseIdentifier:activationRule:unwantedActivationRule:completion:` — the extensions of
    /// the point whose identifier begins with the base identifier (a plain prefix, no separator) and that the rules let
    /// through, in the platform's order. An empty completion is not called.
    void extensionsWithMatchingPointName(std::string_view pointName, const std::optional<BaseIdentifier>& baseIdentifier,
                                         const std::optional<ActivationRule>& activationRule,
                                         const std::optional<UnwantedActivationRule>& unwantedActivationRule,
                                         Completion completion);
    /// `extensionsWithMatchingPointName:baseIdentifier:completion:`
    void extensionsWithMatchingPointName(std::string_view pointName, const BaseIdentifier& baseIdentifier,
                                         Completion completion);
    /// `extensionsWithMatchingPointName:baseIdentifier:unwantedActivationRule:completion:`
    void extensionsWithMatchingPointName(std::string_view pointName, const BaseIdentifier& baseIdentifier,
                                         const UnwantedActivationRule& unwantedActivationRule, Completion completion);
    /// `extensionsWithMatchingPointName:activationRule:completion:`
    void extensionsWithMatchingPointName(std::string_view pointName, const ActivationRule& activationRule,
                                         Completion completion);
    /// `extensionsWithMatchingPointName:unwantedActivationRule:completion:`
    void extensionsWithMatchingPointName(std::string_view pointName, const UnwantedActivationRule& unwantedActivationRule,
                                         Completion completion);
    /// `extensionsWithMatchingPointName:completion:`
    void extensionsWithMatchingPointName(std::string_view pointName, Completion completion);

    /// `processMode` — 1 for an extension that takes samples, 0 for every other.
    static std::int64_t processMode(const AppExtension& extension);
    /// `itemWithTitle:attachmentItem:` — a null item gives an item whose attachment provides none.
    static ExtensionItem itemWithTitle(std::string_view title, Value attachmentItem);

private:
    Log& log_;
    AppExtensions& extensions_;
};

}  // namespace lumacast
