#include "tests/reliability/Journal.h"

#include <cstring>
#include <fstream>
#include <iterator>

namespace lumacast::test {

namespace {

void put(std::string& out, std::uint64_t number) {
    char bytes[sizeof number];
    std::memcpy(bytes, &number, sizeof number);
    out.append(bytes, sizeof bytes);
}

void put(std::string& out, const std::string& text) {
    put(out, text.size());
    out += text;
}

/// Reads from the front of `rest`; false when not enough is there.
bool take(std::string_view& rest, std::uint64_t& number) {
    if (rest.size() < sizeof number) return false;
    std::memcpy(&number, rest.data(), sizeof number);
    rest.remove_prefix(sizeof number);
    return true;
}

bool take(std::string_view& rest, std::string& text) {
    std::uint64_t size = 0;
    if (!take(rest, size) || size > rest.size()) return false;
    text = rest.substr(0, size);
    rest.remove_prefix(size);
    return true;
}

}  // namespace

std::string encode(const JournalEntry& entry) {
    std::string out;
    put(out, static_cast<std::uint64_t>(entry.kind));
    put(out, entry.path);
    put(out, entry.newPath);
    put(out, entry.offset);
    put(out, entry.bytes);
    put(out, entry.time);
    return out;
}

std::optional<std::vector<JournalEntry>> readJournal(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    if (!file) return std::nullopt;
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    std::string_view rest = text;
    std::vector<JournalEntry> entries;
    for (;;) {
        JournalEntry entry;
        std::uint64_t kind = 0;
        if (!take(rest, kind)) break;
        if (kind > static_cast<std::uint64_t>(JournalEntry::Kind::Remove)) return std::nullopt;
        entry.kind = static_cast<JournalEntry::Kind>(kind);
        if (!take(rest, entry.path) || !take(rest, entry.newPath) || !take(rest, entry.offset) ||
            !take(rest, entry.bytes) || !take(rest, entry.time))
            break;
        entries.push_back(std::move(entry));
    }
    return entries;
}

}  // namespace lumacast::test
