#include "base/MessageTables.h"
#include "tests/tables/Tables.h"

namespace lumacast::tables {

namespace {

std::string_view nameOf(ArgumentType type) {
    switch (type) {
        case ArgumentType::Bool: return "bool";
        case ArgumentType::Int32: return "int32";
        case ArgumentType::UInt32: return "uint32";
        case ArgumentType::Int64: return "int64";
        case ArgumentType::Double: return "double";
        case ArgumentType::Size: return "size";
        case ArgumentType::ContextIDs: return "context identifiers";
        case ArgumentType::Text: return "text";
        case ArgumentType::Data: return "bytes";
        case ArgumentType::NullableData: return "bytes or null";
        case ArgumentType::Dictionary: return "dictionary";
        case ArgumentType::NullableDictionary: return "dictionary or null";
        case ArgumentType::Array: return "array";
        case ArgumentType::URL: return "URL";
        case ArgumentType::NullableURL: return "URL or null";
        case ArgumentType::NullableEndpoint: return "endpoint or null";
        case ArgumentType::NullableError: return "error or null";
        case ArgumentType::SharedPlaneObject: return "shared plane or null";
        case ArgumentType::Any: return "anything";
        case ArgumentType::Plain: return "anything without endpoints and planes";
    }
    return "";
}

std::string listed(std::span<const ArgumentType> types) {
    std::string list;
    for (const ArgumentType type : types) list += (list.empty() ? "" : ", ") + std::string(nameOf(type));
    return list;
}

std::string replyOf(const MessageDeclaration& message) {
    if (message.reply == Reply::None) return "none";
    return message.replyValues.empty() ? "without values" : listed(message.replyValues);
}

std::string tableOf(const Protocol& protocol, const std::string& way) {
    std::string text = "\n## " + std::string(protocol.name) + "\n\n" + way + "\n";
    if (protocol.messages.empty()) return text;
    text += "\n" + head({"number", "message", "arguments", "reply"});
    for (std::size_t number = 0; number < protocol.messages.size(); ++number) {
        const MessageDeclaration& message = protocol.messages[number];
        text += row({std::to_string(number), code(message.name), listed(message.arguments), replyOf(message)});
    }
    return text;
}

}  // namespace

std::string messagesPage() {
    return "# Messages\n\n"
           "Every message of every protocol, in the order of its table: its number on the wire is its place. Printed "
           "by\n"
           "`scripts/tables` from `src/base/MessageTables.h`. How they travel: [linux/ipc](../../linux/ipc/README.md). "
           "What each does for\n"
           "an application: [client](../../client/README.md).\n\n"
           "A size is an array of two doubles, width and height; context identifiers are an array of uint32, the "
           "windows. A\n"
           "message that is unknown or has other arguments ends its connection and reaches nobody.\n" +
           tableOf(daemonProtocol(), "From an application to the daemon.") +
           tableOf(clientProtocol(), "From the daemon to an application.") +
           tableOf(broadcastDaemonProtocol(), "From an upload extension that takes samples to the daemon.") +
           tableOf(broadcastExtensionProtocol(), "From the daemon to an upload extension that takes samples.") +
           tableOf(extensionVendorProtocol(),
                   "From the daemon to an extension, over the auxiliary connection of a request.") +
           tableOf(extensionHostProtocol(), "From an extension to its host: deliberately none.");
}

}  // namespace lumacast::tables
