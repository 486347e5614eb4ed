#pragma once
#include <utility>

#include "platform/AppExtension.h"

namespace lumacast {

/// An extension that has a name and nothing else: it can't be launched.
class StubExtension : public AppExtension {
public:
    explicit StubExtension(BundleIdentifier identifier) : identifier_(std::move(identifier)) {}
    BundleIdentifier identifier() const override { return identifier_; }
    std::string extensionPointIdentifier() const override { return {}; }
    const Dictionary& attributes() const override { return nothing_; }
    const Dictionary& infoDictionary() const override { return nothing_; }
    std::vector<Data> icons() const override { return {}; }
    void setRequestCompletionHandler(RequestCompletionHandler) override {}
    void beginExtensionRequestWithInputItems(std::vector<ExtensionItem>, BeginHandler) override {}
    std::shared_ptr<ExtensionContext> extensionContextForRequest(ExtensionRequestID) override { return nullptr; }
    std::optional<std::string> issueReadOnlyFileToken(std::string_view, const std::string&) override {
        return std::nullopt;
    }
    void kill(int) override {}

private:
    const BundleIdentifier identifier_;
    const Dictionary nothing_;
};

}  // namespace lumacast
