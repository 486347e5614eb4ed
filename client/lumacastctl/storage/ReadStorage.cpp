#include "client/lumacastctl/Fields.h"
#include "client/lumacastctl/storage/Storage.h"
#include "linux/system/Json.h"

namespace lumacast::ctl {

namespace {

std::optional<TemporaryFile> readFile(const Value& value) {
    const auto* entry = value.as<Dictionary>();
    const auto name = entry ? textIn(*entry, "name") : std::nullopt;
    if (!name) return std::nullopt;
    return TemporaryFile{*name, countIn(*entry, "bytes"), numberIn(*entry, "modified"), flagIn(*entry, "recording")};
}

}  // namespace

std::variant<StorageReport, std::string> readStorage(std::string_view answer) {
    const auto value = valueFromJson(answer);
    const auto* top = value ? value->as<Dictionary>() : nullptr;
    if (!top) return kNotUnderstood;
    if (const auto error = textIn(*top, "error")) return *error;
    const Value* files = top->find("files");
    const auto* list = files ? files->as<Array>() : nullptr;
    if (!list) return kNotUnderstood;
    StorageReport result;
    result.temporaryDirectory = textIn(*top, "temporaryDirectory").value_or("");
    result.freeBytes = countIn(*top, "freeBytes").value_or(0);
    result.purgeableBytes = countIn(*top, "purgeableBytes");
    result.filesBytes = countIn(*top, "filesBytes").value_or(0);
    for (const Value& entry : *list) {
        auto file = readFile(entry);
        if (!file) return kNotUnderstood;
        result.files.push_back(std::move(*file));
    }
    return result;
}

std::variant<PurgeOutcome, std::string> readPurge(std::string_view answer) {
    const auto value = valueFromJson(answer);
    const auto* top = value ? value->as<Dictionary>() : nullptr;
    if (!top) return kNotUnderstood;
    if (const auto error = textIn(*top, "error")) return *error;
    const Value* freed = top->find("freedBytes");
    if (!freed || (!freed->isNull() && !countIn(*top, "freedBytes"))) return kNotUnderstood;
    return PurgeOutcome{countIn(*top, "freedBytes")};
}

}  // namespace lumacast::ctl
