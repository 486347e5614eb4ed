#include "fuzz/Settings.h"

#include <fcntl.h>
#include <stdlib.h>
#include <unistd.h>

#include <filesystem>
#include <stdexcept>

#include "fuzz/Input.h"

namespace lumacast::fuzz {

namespace {

std::string_view trimmed(std::string_view text) {
    constexpr std::string_view kBlanks = " \t\r\f\v";
    while (!text.empty() && kBlanks.find(text.front()) != std::string_view::npos) text.remove_prefix(1);
    while (!text.empty() && kBlanks.find(text.back()) != std::string_view::npos) text.remove_suffix(1);
    return text;
}

void rewrite(int file, std::string_view text) {
    if (::pwrite(file, text.data(), text.size(), 0) != static_cast<ssize_t>(text.size()) ||
        ::ftruncate(file, static_cast<off_t>(text.size())) != 0)
        throw std::runtime_error("a settings file can't be written");
}

}  // namespace

SettingsFolder::SettingsFolder(const std::string& name) {
    std::string path = std::filesystem::temp_directory_path() / "lumacast-fuzz-XXXXXX";
    if (!::mkdtemp(path.data())) throw std::runtime_error("no folder can be made");
    root_ = path;
    for (const char* whose : {"/user", "/administrator"}) {
        directories_.push_back(root_ + whose);
        const std::filesystem::path file = directories_.back() + "/" + name;
        std::filesystem::create_directories(file.parent_path());
        files_.push_back(::open(file.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    }
}

SettingsFolder::~SettingsFolder() {
    for (const int file : files_) ::close(file);
    std::error_code ignored;
    std::filesystem::remove_all(root_, ignored);
}

void SettingsFolder::write(std::string_view usersFile, std::string_view administratorsFile) {
    rewrite(files_[0], usersFile);
    rewrite(files_[1], administratorsFile);
}

std::vector<std::pair<std::string, std::string>> plainEntries(std::string_view file) {
    std::vector<std::pair<std::string, std::string>> entries;
    if (file.starts_with("\xEF\xBB\xBF")) file.remove_prefix(3);
    bool inSection = false;
    while (!file.empty()) {
        const std::size_t end = std::min(file.find('\n'), file.size());
        const std::string_view line = trimmed(file.substr(0, end));
        file.remove_prefix(std::min(end + 1, file.size()));
        if (line.empty() || line.front() == '#' || line.front() == ';') continue;
        if (line.front() == '[') {
            // A section without a name is what stands before the first one; an open bracket is no section at all.
            if (line.back() == ']') inSection = !trimmed(line.substr(1, line.size() - 2)).empty();
            continue;
        }
        const std::size_t equals = line.find('=');
        if (inSection || equals == std::string_view::npos || trimmed(line.substr(0, equals)).empty()) continue;
        entries.emplace_back(trimmed(line.substr(0, equals)), trimmed(line.substr(equals + 1)));
    }
    return entries;
}

const std::string* lastOf(const std::vector<std::pair<std::string, std::string>>& entries, std::string_view key) {
    const std::string* last = nullptr;
    for (const auto& [name, text] : entries)
        if (name == key) last = &text;
    return last;
}

std::pair<std::string_view, std::string_view> twoFiles(Bytes input) {
    const std::string_view text = textOf(input);
    const std::size_t zero = text.find('\0');
    if (zero == std::string_view::npos) return {text, {}};
    return {text.substr(0, zero), text.substr(zero + 1)};
}

}  // namespace lumacast::fuzz
