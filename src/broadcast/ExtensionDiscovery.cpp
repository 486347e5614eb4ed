#include "broadcast/ExtensionDiscovery.h"

#include <utility>

namespace lumacast {

namespace {

constexpr std::string_view kProcessModeKey = "LCBroadcastProcessMode";
constexpr std::string_view kSampleBufferMode = "LCBroadcastProcessModeSampleBuffer";

/// Whether a rule's value answers true.
bool isTrueValue(const Value* value) {
    if (!value) return false;
    if (const bool* truth = value->as<bool>()) return *truth;
    if (const auto* number = value->as<std::int64_t>()) return *number != 0;
    if (const auto* number = value->as<std::uint64_t>()) return *number != 0;
    const double* number = value->as<double>();
    return number && *number != 0;
}

bool matches(const AppExtension& extension, const std::optional<BaseIdentifier>& baseIdentifier,
             const std::optional<ActivationRule>& wanted, const std::optional<UnwantedActivationRule>& unwanted) {
    if (baseIdentifier && !extension.identifier().text().starts_with(baseIdentifier->text)) return false;
    const Value* attribute = extension.attributes().find(kExtensionActivationRule);
    const Dictionary* rule = attribute ? attribute->as<Dictionary>() : nullptr;
    // Without a rule the unwanted one is deliberately not looked at.
    if (!rule) return !wanted;
    if (wanted && !isTrueValue(rule->find(wanted->key))) return false;
    return !(unwanted && isTrueValue(rule->find(unwanted->key)));
}

}  // namespace

void ExtensionDiscovery::extensionsWithMatchingPointName(
    std::string_view pointName, const std::optional<BaseIdentifier>& baseIdentifier,
    const std::optional<ActivationRule>& activationRule,
    const std::optional<UnwantedActivationRule>& unwantedActivationRule, Completion completion) {
    extensions_.extensionsWithMatchingPoint(
        std::string(pointName),
        [&log = log_, baseIdentifier, activationRule, unwantedActivationRule, completion = std::move(completion)](
            std::vector<std::shared_ptr<AppExtension>> found, std::optional<Error> error) {
            std::vector<std::shared_ptr<AppExtension>> kept;
            for (auto& extension : found) {
                log.line("%s", extension->extensionPointIdentifier());
                if (matches(*extension, baseIdentifier, activationRule, unwantedActivationRule))
                    kept.push_back(std::move(extension));
            }
            if (completion) completion(std::move(kept), std::move(error));
        });
}

void ExtensionDiscovery::extensionsWithMatchingPointName(std::string_view pointName,
                                                         const BaseIdentifier& baseIdentifier, Completion completion) {
    extensionsWithMatchingPointName(pointName, baseIdentifier, std::nullopt, std::nullopt, std::move(completion));
}

void ExtensionDiscovery::extensionsWithMatchingPointName(std::string_view pointName,
                                                         const BaseIdentifier& baseIdentifier,
                                                         const UnwantedActivationRule& unwantedActivationRule,
                                                         Completion completion) {
    extensionsWithMatchingPointName(pointName, baseIdentifier, std::nullopt, unwantedActivationRule,
                                    std::move(completion));
}

void ExtensionDiscovery::extensionsWithMatchingPointName(std::string_view pointName,
                                                         const ActivationRule& activationRule, Completion completion) {
    extensionsWithMatchingPointName(pointName, std::nullopt, activationRule, std::nullopt, std::move(completion));
}

void ExtensionDiscovery::extensionsWithMatchingPointName(std::string_view pointName,
                                                         const UnwantedActivationRule& unwantedActivationRule,
                                                         Completion completion) {
    extensionsWithMatchingPointName(pointName, std::nullopt, std::nullopt, unwantedActivationRule,
                                    std::move(completion));
}

void ExtensionDiscovery::extensionsWithMatchingPointName(std::string_view pointName, Completion completion) {
    extensionsWithMatchingPointName(pointName, std::nullopt, std::nullopt, std::nullopt, std::move(completion));
}

std::int64_t ExtensionDiscovery::processMode(const AppExtension& extension) {
    constexpr std::int64_t kMovieClips = 0, kSampleBuffers = 1;
    const Value* own = extension.infoDictionary().find(kExtensionDictionary);
    const Dictionary* dictionary = own ? own->as<Dictionary>() : nullptr;
    const Value* mode = dictionary ? dictionary->find(kProcessModeKey) : nullptr;
    const std::string* text = mode ? mode->as<std::string>() : nullptr;
    return text && *text == kSampleBufferMode ? kSampleBuffers : kMovieClips;
}

ExtensionItem ExtensionDiscovery::itemWithTitle(std::string_view title, Value attachmentItem) {
    return {std::string(title), {ItemProvider{std::string(kGenericDataType), std::move(attachmentItem), std::nullopt}}};
}

}  // namespace lumacast
