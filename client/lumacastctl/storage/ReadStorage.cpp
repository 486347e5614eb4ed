#include <map>

#include "client/lumacastctl/Fields.h"
#include "client/lumacastctl/storage/Storage.h"
#include "linux/system/Json.h"

namespace lumacast::ctl {

namespace {

/// For people.
std::string stateText(const Dictionary& entry) {
    static const std::map<std::string, std::string, std::less<>> kTexts{
        {"beingRecorded", "being recorded"},
        {"beingWritten", "being written"},
        {"finished", "finished"},
        {"recovered", "recovered: the recording was cut off"},
        {"unfinished", "unfinished: the recording was cut off"},
        {"unfinishedCopy", "unfinished copy"},
        {"other", "not a movie"}};
    const auto found = kTexts.find(textIn(entry, "state").value_or(flagIn(entry, "recording") ? "beingRecorded" : ""));
    return found == kTexts.end() ? "" : found->second;
}

std::optional<TemporaryFile> readFile(const Value& value) {
    const auto* entry = value.as<Dictionary>();
    const auto name = entry ? textIn(*entry, "name") : std::nullopt;
    if (!name) return std::nullopt;
    return TemporaryFile{*name,
                         countIn(*entry, "bytes"),
                         numberIn(*entry, "modified"),
                         flagIn(*entry, "recording"),
                         numberIn(*entry, "seconds"),
                         stateText(*entry)};
}

const Array* listIn(const std::optional<Value>& answer, std::string_view key) {
    const auto* top = answer ? answer->as<Dictionary>() : nullptr;
    const Value* list = top ? top->find(key) : nullptr;
    return list ? list->as<Array>() : nullptr;
}

void addMovie(Dictionary& file, const Dictionary& movie) {
    std::string state = textIn(movie, "state").value_or("");
    if (flagIn(movie, "beingWritten")) state = "beingWritten";
    if (flagIn(file, "recording")) state = "beingRecorded";
    if (!state.empty()) file.set("state", state);
    if (const auto seconds = numberIn(movie, "seconds")) file.set("seconds", *seconds);
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

std::string withMovies(const std::string& storage, std::string_view movies) {
    const auto report = valueFromJson(storage);
    const auto answer = valueFromJson(movies);
    const Array* const files = listIn(report, "files");
    const Array* const list = listIn(answer, "movies");
    if (!files || !list) return storage;
    std::map<std::string, const Dictionary*, std::less<>> byName;
    for (const Value& value : *list) {
        const auto* movie = value.as<Dictionary>();
        if (const auto name = movie ? textIn(*movie, "name") : std::nullopt) byName[*name] = movie;
    }
    Array merged;
    for (const Value& value : *files) {
        const auto* file = value.as<Dictionary>();
        const auto name = file ? textIn(*file, "name") : std::nullopt;
        const auto movie = name ? byName.find(*name) : byName.end();
        if (movie == byName.end()) {
            merged.push_back(value);
            continue;
        }
        Dictionary entry = *file;
        addMovie(entry, *movie->second);
        merged.emplace_back(std::move(entry));
    }
    Dictionary result = *report->as<Dictionary>();
    result.set("files", std::move(merged));
    return jsonText(result);
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
