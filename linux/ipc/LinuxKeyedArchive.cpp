#include "linux/ipc/LinuxKeyedArchive.h"

#include <algorithm>
#include <array>
#include <string>

#include "base/Limits.h"
#include "base/Wire.h"

namespace lumacast {

namespace {

constexpr std::array<std::uint8_t, 12> kHead{'L', 'C', 'A', 'R', 'C', 'H', 'I', 'V', 1, 0, 0, 0};
constexpr std::string_view kRootObjectKey = "root";
constexpr std::string_view kClassKey = "class", kFieldsKey = "fields";

/// Whether an archive can hold the value: no handles, no errors, `depth` levels of arrays and dictionaries at most.
bool isArchivable(const Value& value, std::uint64_t depth) {
    if (value.as<Value::EndpointRef>() || value.as<Value::PlaneRef>() || value.asError()) return false;
    const Array* array = value.as<Array>();
    const Dictionary* dictionary = value.as<Dictionary>();
    if (!array && !dictionary) return true;
    if (depth == 0) return false;
    if (array)
        return std::all_of(array->begin(), array->end(), [&](const Value& v) { return isArchivable(v, depth - 1); });
    const auto& entries = dictionary->entries();
    return std::all_of(entries.begin(), entries.end(), [&](const auto& e) { return isArchivable(e.second, depth - 1); });
}

}  // namespace

std::optional<Data> LinuxKeyedArchive::archivedData(const ArchivedObject& root) {
    const Value fields(root.fields);
    if (!isArchivable(fields, limitOf(Limit::ArchiveDepth))) return std::nullopt;
    WireBody body;
    body.bytes.assign(kHead.begin(), kHead.end());
    const Dictionary object{{std::string(kClassKey), root.className}, {std::string(kFieldsKey), fields}};
    if (!encode(Value(Dictionary{{std::string(kRootObjectKey), object}}), body)) return std::nullopt;
    if (body.bytes.size() > limitOf(Limit::ArchiveBytes)) return std::nullopt;
    return std::move(body.bytes);
}

std::optional<ArchivedObject> LinuxKeyedArchive::unarchivedRoot(const Data& archive, std::string_view allowedClass) {
    if (archive.size() > limitOf(Limit::ArchiveBytes) || archive.size() < kHead.size() ||
        !std::equal(kHead.begin(), kHead.end(), archive.begin()))
        return std::nullopt;
    const auto top = decode(std::span(archive).subspan(kHead.size()), {});
    const Dictionary* objects = top ? top->as<Dictionary>() : nullptr;
    const Value* root = objects ? objects->find(kRootObjectKey) : nullptr;
    const Dictionary* object = root ? root->as<Dictionary>() : nullptr;
    const Value* className = object ? object->find(kClassKey) : nullptr;
    const Value* fields = object ? object->find(kFieldsKey) : nullptr;
    if (!className || !fields || !className->as<std::string>() || !fields->as<Dictionary>()) return std::nullopt;
    if (*className->as<std::string>() != allowedClass || !isArchivable(*fields, limitOf(Limit::ArchiveDepth)))
        return std::nullopt;
    return ArchivedObject{*className->as<std::string>(), *fields->as<Dictionary>()};
}

}  // namespace lumacast
