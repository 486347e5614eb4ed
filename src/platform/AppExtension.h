#pragma once
// Programs of third parties that the platform launches for others: app extensions, their requests and the files they may read.

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/Identifiers.h"
#include "base/MessageTables.h"
#include "base/Value.h"
#include "platform/IpcConnection.h"

namespace lumacast {

/// The type of an attachment that is just a value: text, bytes, a dictionary.
inline constexpr std::string_view kGenericDataType = "com.orvane.generic-data";

/// Provides one item of an extension item. A value.
struct ItemProvider {
    std::string typeIdentifier;
    Value item;  ///< null: there is none
    /// Why the item can't be loaded; none when it can.
    std::optional<Error> loadError;

    bool hasItemConformingTo(std::string_view type) const { return typeIdentifier == type; }
    /// `loadItemForTypeIdentifier:completionHandler:` — calls the handler once, inline, with the item or the error.
    void loadItem(const std::function<void(const Value& item, const std::optional<Error>& error)>& handler) const {
        handler(item, loadError);
    }
};

/// One input or output item of an extension request. A value.
struct ExtensionItem {
    std::string attributedTitle;  ///< a text without attributes
    std::vector<ItemProvider> attachments;
};

/// The host side of one extension request. Its class says how the auxiliary connection is typed; see ExtensionContextClass.
class ExtensionContext {
public:
    virtual ~ExtensionContext() = default;
    /// `didConnectToVendor:` — the platform has opened the auxiliary connection. Request lane.
    virtual void didConnectToVendor() {}
    /// `_auxiliaryConnection` — to the extension's process, resumed; null once it has gone. Any lane.
    virtual std::shared_ptr<IpcConnection> auxiliaryConnection() const = 0;
};

/// What the platform makes a context of for each request.
struct ExtensionContextClass {
    const Protocol* auxiliaryHostProtocol = nullptr;    ///< what the extension may send here
    const Protocol* auxiliaryVendorProtocol = nullptr;  ///< what may be sent to the extension
    /// Makes the context of a request whose auxiliary connection is this one. Request lane.
    std::function<std::shared_ptr<ExtensionContext>(std::weak_ptr<IpcConnection> auxiliaryConnection)> make;
};

enum class ExtensionRequestID : std::uint64_t {};

/// The key of `attributes` that holds the activation rule: a dictionary where the extension has one.
inline constexpr std::string_view kExtensionActivationRule = "ExtensionActivationRule";
/// The key of `infoDictionary` that holds the extension's own dictionary.
inline constexpr std::string_view kExtensionDictionary = "Extension";
/// The key of `infoDictionary` that holds its name in the user's language, a text.
inline constexpr std::string_view kExtensionDisplayName = "DisplayName";

/// One installed extension, as one query found it. Each object has a process of its own: launched by the first request,
/// serving all later ones, ended when it is killed or exits. When the object is destroyed its process ends as soon as it
/// has completed the requests it was begun with, a minute later at the latest; until then their completion is still told.
/// Shared by whoever broadcasts through it.
///
/// Lanes: operations from any lane, none blocks. The handlers of one extension are called one after the other on a lane of
/// its own, on which they may wait; never inline.
class AppExtension {
public:
    using BeginHandler = std::function<void(std::optional<ExtensionRequestID> request, std::optional<Error> error)>;
    using RequestCompletionHandler =
        std::function<void(ExtensionRequestID request, std::vector<ExtensionItem> returned)>;

    virtual ~AppExtension() = default;
    virtual BundleIdentifier identifier() const = 0;
    virtual std::string extensionPointIdentifier() const = 0;
    /// What its entry declares about its activation.
    virtual const Dictionary& attributes() const = 0;
    /// Its information dictionary.
    virtual const Dictionary& infoDictionary() const = 0;
    /// Its icons as PNG files, the best one first; may be empty.
    virtual std::vector<Data> icons() const = 0;

    /// `setRequestCompletionHandler:` — one slot: called for each request that completes from now on, with what the
    /// extension returned. A request that the extension leaves or dies over is not told.
    virtual void setRequestCompletionHandler(RequestCompletionHandler handler) = 0;
    /// `beginExtensionRequestWithInputItems:completion:` — launches the extension if need be and hands it the items.
    /// The handler is called once: with the request's identifier when the extension has taken it, or with the error.
    virtual void beginExtensionRequestWithInputItems(std::vector<ExtensionItem> items, BeginHandler handler) = 0;
    /// `_extensionContextForUUID:` — of a request that was begun; null when there is none.
    virtual std::shared_ptr<ExtensionContext> extensionContextForRequest(ExtensionRequestID request) = 0;
    /// A token that this extension, and nobody else, can exchange once for a descriptor to read this file, while the
    /// request goes on among whose items it is, as data. None when there is no such file.
    virtual std::optional<std::string> issueReadOnlyFileToken(std::string_view tokenClass, const std::string& path) = 0;
    /// `_kill:` — sends its process the signal; nothing when none is running.
    virtual void kill(int signal) = 0;
};

/// Finds installed extensions.
class AppExtensions {
public:
    using Matched = std::function<void(std::vector<std::shared_ptr<AppExtension>>, std::optional<Error>)>;

    virtual ~AppExtensions() = default;
    /// What requests' contexts are made of. Before the first query.
    virtual void setContextClass(ExtensionContextClass contextClass) = 0;
    /// `extensionsWithMatchingAttributes:completion:` — all extensions of this point, in the platform's order, which is
    /// the same each time; new objects. The handler is called once, on a lane of the platform's, never inline; with an
    /// error, and none of them, when they can't be looked up.
    virtual void extensionsWithMatchingPoint(const std::string& extensionPointIdentifier, Matched handler) = 0;
};

}  // namespace lumacast
