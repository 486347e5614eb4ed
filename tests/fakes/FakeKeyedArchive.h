#pragma once
#include <map>
#include <mutex>
#include <string>

#include "base/Limits.h"
#include "base/Wire.h"
#include "platform/KeyedArchive.h"

namespace lumacast {

/// Archives that are kept in memory: an archive's bytes are only its number, so nobody can read them but this fake.
/// Thread-safe.
class FakeKeyedArchive final : public KeyedArchive {
public:
    std::optional<Data> archivedData(const ArchivedObject& root) override {
        if (!isArchivable(Value(root.fields), limitOf(Limit::ArchiveDepth))) return std::nullopt;
        WireBody body;
        if (!encode(Value(root.fields), body) || body.bytes.size() + kWrapping > limitOf(Limit::ArchiveBytes))
            return std::nullopt;
        const std::lock_guard lock(mutex_);
        const std::string name = "archive " + std::to_string(archives_.size() + 1);
        archives_[name] = root;
        return Data(name.begin(), name.end());
    }
    std::optional<ArchivedObject> unarchivedRoot(const Data& archive, std::string_view allowedClass) override {
        const std::lock_guard lock(mutex_);
        const auto found = archives_.find(std::string(archive.begin(), archive.end()));
        if (found == archives_.end() || found->second.className != allowedClass) return std::nullopt;
        return found->second;
    }

private:
    /// About what an archive has beside the fields.
    static constexpr std::size_t kWrapping = 64;

    /// With `depth` levels of arrays and dictionaries at most.
    static bool isArchivable(const Value& value, std::uint64_t depth) {
        if (value.as<Value::EndpointRef>() || value.as<Value::PlaneRef>() || value.asError()) return false;
        if ((value.as<Array>() || value.as<Dictionary>()) && depth-- == 0) return false;
        if (const Array* array = value.as<Array>())
            for (const Value& inner : *array)
                if (!isArchivable(inner, depth)) return false;
        if (const Dictionary* dictionary = value.as<Dictionary>())
            for (const auto& [key, inner] : dictionary->entries())
                if (!isArchivable(inner, depth)) return false;
        return true;
    }

    std::mutex mutex_;
    std::map<std::string, ArchivedObject> archives_;
};

}  // namespace lumacast
