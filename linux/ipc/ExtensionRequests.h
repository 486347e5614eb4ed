#pragma once
// What a host and the process of an extension say to each other about requests. Shared by both ends.
//
// The host launches the process with two connected stream sockets: descriptor kExtensionRequestsDescriptor carries these
// two protocols (and the exchange of file tokens), kExtensionAuxiliaryDescriptor the auxiliary connection, typed by
// whoever made the request. Both speak the transport's frames; the process says hello on both when it is up.

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

#include "base/MessageTables.h"
#include "platform/AppExtension.h"

namespace lumacast {

inline constexpr int kExtensionRequestsDescriptor = 3;
inline constexpr int kExtensionAuxiliaryDescriptor = 4;

/// Host to extension: a request begins. The reply says that the extension has taken it.
enum class ExtensionRequestMessage : std::uint16_t { BeginRequest };
/// Extension to host: a request is over, with what is returned, or with the error it was given up for.
enum class ExtensionRequestHostMessage : std::uint16_t { CompleteRequest, CancelRequest };

/// `beginRequest:items:` (int64, array; reply without values)
const Protocol& extensionRequestProtocol();
/// `completeRequest:returningItems:` (int64, array), `cancelRequest:withError:` (int64, error or null)
const Protocol& extensionRequestHostProtocol();

/// Items as a message's array: per item a dictionary of "title" (text) and "attachments" (array of dictionaries of "type",
/// text, and "item", anything but descriptors; absent when null). Load errors don't travel.
Array encodeItems(const std::vector<ExtensionItem>& items);
/// None for anything that is not that.
std::optional<std::vector<ExtensionItem>> decodeItems(const Array& items);

/// What an extension returns with a request it completes, as far as it is any of that.
struct ReturnedItems {
    std::vector<ExtensionItem> items;  ///< at most Limit::ExtensionItemsReturned
    std::size_t illFormed = 0;         ///< were looked at and are none
    bool isCut = false;                ///< there were more, which were not looked at
};
ReturnedItems returnedItems(const Array& items);

}  // namespace lumacast
