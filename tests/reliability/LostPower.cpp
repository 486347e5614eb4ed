#include "tests/reliability/LostPower.h"

#include <algorithm>

namespace lumacast::test {

namespace {

std::string folderOf(const std::string& path) { return path.substr(0, path.rfind('/')); }

void put(std::string& file, std::uint64_t offset, std::string_view bytes) {
    if (file.size() < offset + bytes.size()) file.resize(offset + bytes.size(), '\0');
    file.replace(offset, bytes.size(), bytes);
}

}  // namespace

void LostPower::add(const JournalEntry& entry) {
    using Kind = JournalEntry::Kind;
    const auto found = files_.find(entry.path);
    switch (entry.kind) {
        case Kind::Make:
            if (found == files_.end()) files_[entry.path] = std::make_shared<File>();
            break;
        case Kind::MakeDirectory: break;
        case Kind::Write:
            if (found != files_.end()) found->second->since.push_back({entry.offset, entry.bytes});
            break;
        case Kind::Sync:
            if (found != files_.end()) {
                for (const Write& write : found->second->since) put(found->second->synced, write.offset, write.bytes);
                found->second->since.clear();
            } else {  // a folder: its names
                for (auto& [path, file] : files_) {
                    if (folderOf(path) != entry.path) continue;
                    file->isNameSynced = true;
                    file->nameBefore.reset();
                }
                std::erase_if(removed_, [&](const auto& each) { return folderOf(each.first) == entry.path; });
            }
            break;
        case Kind::Rename:
            if (found == files_.end()) break;
            if (const auto target = files_.find(entry.newPath); target != files_.end()) removed_[entry.newPath] = target->second;
            found->second->nameBefore = entry.path;
            files_[entry.newPath] = found->second;
            files_.erase(entry.path);
            break;
        case Kind::Remove:
            if (found == files_.end()) break;
            removed_[entry.path] = found->second;
            files_.erase(found);
            break;
    }
}

std::map<std::string, std::string> LostPower::filesBelow(const std::string& folder, Rest rest, std::uint32_t seed) const {
    std::mt19937 random(seed);
    const auto contentOf = [&](const File& file) {
        std::string bytes = file.synced;
        if (rest == Rest::Gone) return bytes;
        for (std::size_t i = 0; i < file.since.size(); ++i) {
            const Write& write = file.since[i];
            const std::uint64_t end = write.offset + write.bytes.size();
            if (bytes.size() < end) bytes.resize(end, '\0');
            if (rest == Rest::Zeros) continue;
            const bool isLast = i + 1 == file.since.size();
            for (std::uint64_t at = write.offset; at < end;) {
                const std::uint64_t next = std::min(end, (at / kSector + 1) * kSector);
                const bool isLastSector = next == end;
                std::string_view sector(write.bytes);
                sector = sector.substr(at - write.offset, next - at);
                if (rest == Rest::There && isLast && isLastSector) sector = sector.substr(0, sector.size() / 2);
                if (rest != Rest::Any || random() % 2 == 0) put(bytes, at, sector);
                at = next;
            }
        }
        return bytes;
    };
    std::map<std::string, std::string> result;
    const auto add = [&](const std::string& path, const File& file) {
        if (path.starts_with(folder + "/")) result[path.substr(folder.size() + 1)] = contentOf(file);
    };
    for (const auto& [path, file] : files_) {
        const bool hasNewName = file->isNameSynced && !file->nameBefore;
        if (hasNewName || rest != Rest::Gone) add(path, *file);
        else if (file->nameBefore && file->isNameSynced) add(*file->nameBefore, *file);
    }
    if (rest == Rest::Gone)
        for (const auto& [path, file] : removed_)
            if (file->isNameSynced) add(path, *file);
    return result;
}

}  // namespace lumacast::test
