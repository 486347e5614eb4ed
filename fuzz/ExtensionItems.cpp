// What the process of an extension says of a request: that it is complete, with items, or given up, with an error. The
// first byte says what the rest is: 0 the arguments of a completion, 1 those of a giving up (the kinds of the handles
// that came beside them, how many, and their bytes), 2 the recipe of items (modulo 3).

#include <algorithm>
#include <array>
#include <string>

#include "base/Limits.h"
#include "base/Wire.h"
#include "broadcast/ConfigurationArchive.h"
#include "broadcast/PayloadKeys.h"
#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "fuzz/ValueRecipe.h"
#include "linux/ipc/ExtensionRequests.h"
#include "linux/ipc/LinuxKeyedArchive.h"

namespace lumacast::fuzz {

namespace {

constexpr std::array kTitles{kItemBroadcastConfiguration, kItemServiceInfo, kItemRequestedFinish, std::string_view("")};

const MessageDeclaration& declarationOf(ExtensionRequestHostMessage message) {
    return extensionRequestHostProtocol().messages[static_cast<std::size_t>(message)];
}

bool isAttachment(const Value& value) {
    const auto* entries = value.as<Dictionary>();
    const Value* type = entries ? entries->find("type") : nullptr;
    const Value* item = entries ? entries->find("item") : nullptr;
    return type && type->as<std::string>() && (!item || measureOf(*item).handles == 0);
}

/// An item as README.md describes it, looked at once more.
bool isItem(const Value& value) {
    const auto* entries = value.as<Dictionary>();
    const Value* title = entries ? entries->find("title") : nullptr;
    const Value* list = entries ? entries->find("attachments") : nullptr;
    const auto* attachments = list ? list->as<Array>() : nullptr;
    return title && title->as<std::string>() && attachments &&
           std::all_of(attachments->begin(), attachments->end(), isAttachment);
}

/// As the daemon takes it: a configuration that does not decode is none.
void load(const ItemProvider& provider, const std::string& title) {
    int loads = 0;
    provider.loadItem([&](const Value& item, const std::optional<Error>& error) {
        ++loads;
        require(!error, "what has travelled can be loaded");
        require(measureOf(item).handles == 0, "no item of an extension holds memory or endpoints");
        const Data* archive = title == kItemBroadcastConfiguration ? item.as<Data>() : nullptr;
        LinuxKeyedArchive archives;
        if (archive) (void)configurationIn(archives, *archive);
    });
    require(loads == 1, "an item is loaded once");
}

Data bytesOf(const Array& values) {
    WireBody body;
    require(encodeArray(values, body) && body.handles.empty(), "what was read can be written, and has no handles");
    return body.bytes;
}

void checkItems(const Array& items) {
    const ReturnedItems returned = returnedItems(items);
    constexpr std::size_t kMost = limitOf(Limit::ExtensionItemsReturned);
    std::vector<const Value*> good;
    std::size_t looked = 0;
    for (; looked < items.size() && good.size() < kMost; ++looked)
        if (isItem(items[looked])) good.push_back(&items[looked]);
    require(returned.items.size() == good.size(), "an extension returns its items, as many as it may");
    require(returned.illFormed == looked - good.size(), "what is no item is counted");
    require(returned.isCut == (looked < items.size()), "it is told when there were too many");
    for (std::size_t i = 0; i < good.size(); ++i) {
        const ExtensionItem& item = returned.items[i];
        const auto& entries = *good[i]->as<Dictionary>();
        require(*entries.find("title")->as<std::string>() == item.attributedTitle, "items keep their order and titles");
        require(entries.find("attachments")->as<Array>()->size() == item.attachments.size(), "no attachment is lost");
        for (const ItemProvider& provider : item.attachments) load(provider, item.attributedTitle);
    }
    // Entries that nobody reads are not written again.
    const Array written = encodeItems(returned.items);
    const auto again = decodeItems(written);
    require(again && bytesOf(encodeItems(*again)) == bytesOf(written), "items that were read are written as the same");
    const bool areAllGood = std::all_of(items.begin(), items.end(), isItem);
    require(decodeItems(items).has_value() == areAllGood, "a list of items is one when all of them are");
}

void checkMessage(Input& in, ExtensionRequestHostMessage message) {
    std::vector<Value> handles;
    const unsigned kinds = in.byte(), count = in.below(4);
    for (unsigned i = 0; i < count; ++i) handles.push_back(makeHandle((kinds >> i & 1) != 0));
    const auto arguments = decodeArray(in.rest(), handles);
    if (!arguments || !matches(*arguments, declarationOf(message).arguments)) return;
    require(arguments->size() == 2 && (*arguments)[0].as<std::int64_t>(), "an answer names its request");
    if (message == ExtensionRequestHostMessage::CompleteRequest) return checkItems(*(*arguments)[1].as<Array>());
    const Error* error = (*arguments)[1].asError();
    require(error || (*arguments)[1].isNull(), "a request is given up for an error, or for none");
    if (error) require(!describe(*error).empty(), "an error can be told");
}

Value attachmentOf(Input& in) {
    Dictionary entry;
    if (const unsigned type = in.below(4); type == 3)
        entry.set("type", valueOf(in));
    else if (type > 0)
        entry.set("type", type == 1 ? kGenericDataType : "public.text");
    if (in.flag()) entry.set("item", valueOf(in));
    if (in.below(8) == 7) entry.set("more", valueOf(in));
    return Value(std::move(entry));
}

Value itemOf(Input& in) {
    if (in.below(16) == 15) return valueOf(in);
    Dictionary entries;
    const unsigned title = in.below(kTitles.size() + 2);
    if (title < kTitles.size()) entries.set("title", kTitles[title]);
    if (title == kTitles.size()) entries.set("title", valueOf(in));
    Array attachments;
    for (unsigned count = in.below(4); count > 0; --count) attachments.push_back(attachmentOf(in));
    if (in.below(16) != 15) entries.set("attachments", Value(std::move(attachments)));
    return Value(std::move(entries));
}

void checkRecipe(Input& in) {
    Array items;
    for (unsigned count = in.below(24); count > 0; --count) items.push_back(itemOf(in));
    const Array arguments{Value(std::int64_t{1}), Value(items)};
    WireBody body;
    if (!encodeArray(arguments, body)) return;  // can't come: the transport doesn't carry it
    if (matches(arguments, declarationOf(ExtensionRequestHostMessage::CompleteRequest).arguments)) checkItems(items);
}

}  // namespace

void extensionItems(Bytes input) {
    Input in(input);
    switch (in.below(3)) {
        case 0: return checkMessage(in, ExtensionRequestHostMessage::CompleteRequest);
        case 1: return checkMessage(in, ExtensionRequestHostMessage::CancelRequest);
        default: return checkRecipe(in);
    }
}

}  // namespace lumacast::fuzz
