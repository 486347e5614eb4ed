#include "linux/ipc/ExtensionRequests.h"

#include <array>
#include <string>
#include <utility>

#include "base/Limits.h"

namespace lumacast {

namespace {

using A = ArgumentType;

constexpr std::string_view kTitle = "title", kAttachments = "attachments", kType = "type", kItem = "item";

constexpr std::array kBegin{A::Int64, A::Array};
constexpr std::array kCancel{A::Int64, A::NullableError};
constexpr std::array kRequestMessages{MessageDeclaration{"beginRequest:items:", kBegin, Reply::Expected, {}}};
constexpr std::array kHostMessages{MessageDeclaration{"completeRequest:returningItems:", kBegin},
                                   MessageDeclaration{"cancelRequest:withError:", kCancel}};
/// An item may be anything that is copied on its way: nobody's memory is kept for a process that is gone.
constexpr std::array kItemType{A::Plain};
constexpr Protocol kRequestProtocol{"ExtensionRequests", kRequestMessages};
constexpr Protocol kHostProtocol{"ExtensionRequestHost", kHostMessages};

const std::string* textIn(const Dictionary& dictionary, std::string_view key) {
    const Value* value = dictionary.find(key);
    return value ? value->as<std::string>() : nullptr;
}

std::optional<ItemProvider> decodeAttachment(const Value& value) {
    const Dictionary* entries = value.as<Dictionary>();
    const std::string* type = entries ? textIn(*entries, kType) : nullptr;
    if (!type) return std::nullopt;
    const Value* item = entries->find(kItem);
    if (item && !matches({*item}, kItemType)) return std::nullopt;
    return ItemProvider{*type, item ? *item : Value(), std::nullopt};
}

std::optional<ExtensionItem> decodeItem(const Value& value) {
    const Dictionary* entries = value.as<Dictionary>();
    const std::string* title = entries ? textIn(*entries, kTitle) : nullptr;
    const Value* list = entries ? entries->find(kAttachments) : nullptr;
    const Array* attachments = list ? list->as<Array>() : nullptr;
    if (!title || !attachments) return std::nullopt;
    ExtensionItem item{*title, {}};
    for (const Value& attachment : *attachments) {
        auto provider = decodeAttachment(attachment);
        if (!provider) return std::nullopt;
        item.attachments.push_back(std::move(*provider));
    }
    return item;
}

}  // namespace

const Protocol& extensionRequestProtocol() { return kRequestProtocol; }
const Protocol& extensionRequestHostProtocol() { return kHostProtocol; }

Array encodeItems(const std::vector<ExtensionItem>& items) {
    Array encoded;
    for (const ExtensionItem& item : items) {
        Array attachments;
        for (const ItemProvider& provider : item.attachments) {
            Dictionary entry{{std::string(kType), provider.typeIdentifier}};
            if (!provider.item.isNull()) entry.set(std::string(kItem), provider.item);
            attachments.emplace_back(std::move(entry));
        }
        encoded.emplace_back(Dictionary{{std::string(kTitle), item.attributedTitle},
                                        {std::string(kAttachments), Value(std::move(attachments))}});
    }
    return encoded;
}

std::optional<std::vector<ExtensionItem>> decodeItems(const Array& items) {
    std::vector<ExtensionItem> decoded;
    for (const Value& value : items) {
        auto item = decodeItem(value);
        if (!item) return std::nullopt;
        decoded.push_back(std::move(*item));
    }
    return decoded;
}

ReturnedItems returnedItems(const Array& items) {
    ReturnedItems returned;
    for (const Value& item : items) {
        if (returned.items.size() == limitOf(Limit::ExtensionItemsReturned)) {
            returned.isCut = true;
            break;
        }
        if (auto decoded = decodeItem(item))
            returned.items.push_back(std::move(*decoded));
        else
            ++returned.illFormed;
    }
    return returned;
}

}  // namespace lumacast
