#include "tests/docs/SourceTree.h"

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <regex>
#include <unordered_set>

#include "tests/unit/architecture/SourceText.h"

namespace lumacast::docs {

namespace fs = std::filesystem;

namespace {

const fs::path kTop(LC_SOURCE_DIR);

bool isSource(std::string_view path) {
    return path.ends_with(".h") || path.ends_with(".cpp");
}

bool isNamePart(char c) {
    return std::isalnum(static_cast<unsigned char>(c)) != 0 || c == '_';
}

void addNames(std::unordered_set<std::string>& names, std::string_view code) {
    for (std::size_t begin = 0; begin < code.size();) {
        std::size_t end = begin;
        while (end < code.size() && isNamePart(code[end])) ++end;
        if (end > begin) names.emplace(code.substr(begin, end - begin));
        begin = end + 1;
    }
}

const std::unordered_set<std::string>& namesOf(const std::string& path) {
    static std::map<std::string, std::unordered_set<std::string>> known;
    const auto [entry, isNew] = known.try_emplace(path);
    if (isNew) addNames(entry->second, architecture::codeOf(fileText(path)));
    return entry->second;
}

}  // namespace

const std::vector<std::string>& treeFiles() {
    static const std::vector<std::string> files = [] {
        std::vector<std::string> found;
        for (fs::recursive_directory_iterator entry(kTop), end; entry != end; ++entry) {
            const std::string name = entry->path().filename().string();
            const bool isKept = name == ".git" || (entry.depth() == 0 && name.starts_with("build"));
            if (entry->is_directory() && (isKept || name == "__pycache__")) entry.disable_recursion_pending();
            if (entry->is_regular_file()) found.push_back(fs::relative(entry->path(), kTop).string());
        }
        std::sort(found.begin(), found.end());
        return found;
    }();
    return files;
}

bool isThere(std::string_view path) {
    std::error_code error;
    return fs::exists(kTop / path, error);
}

std::string fileText(std::string_view path) {
    std::ifstream stream(kTop / path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(stream), {});
}

std::string textBelow(std::string_view folder, const std::vector<std::string>& endings) {
    const std::string prefix = folder.empty() ? "" : std::string(folder) + "/";
    std::string text;
    for (const std::string& path : treeFiles()) {
        const auto isWanted = [&](const std::string& ending) { return path.ends_with(ending); };
        if (path.starts_with(prefix) && std::any_of(endings.begin(), endings.end(), isWanted)) text += fileText(path);
    }
    return text;
}

bool isNameInCode(std::string_view name) {
    for (const char* folder : {"src", "linux", "headless", "client", "extensions", "examples", "tests"})
        if (isNameIn(folder, name)) return true;
    return false;
}

bool isNameIn(std::string_view path, std::string_view name) {
    while (path.ends_with('/')) path.remove_suffix(1);
    for (const std::string& file : treeFiles()) {
        const bool isBelow = file.starts_with(path) && file.size() > path.size() && file[path.size()] == '/';
        if ((file == path || (isBelow && isSource(file))) && namesOf(file).contains(std::string(name))) return true;
    }
    return false;
}

const std::set<std::string>& testNames() {
    static const std::set<std::string> names = [] {
        std::set<std::string> found;
        const std::regex declaration("TEST(?:_F|_P)?\\(\\s*(\\w+)\\s*,\\s*(\\w+)\\s*\\)");
        const std::regex suite("INSTANTIATE_TEST_SUITE_P\\(\\s*(\\w+)\\s*,\\s*(\\w+)");
        std::multimap<std::string, std::string> prefixes;
        for (const std::string& path : treeFiles()) {
            if (!path.ends_with(".cpp") || !path.starts_with("tests/")) continue;
            const std::string text = fileText(path);
            for (std::sregex_iterator test(text.begin(), text.end(), declaration), end; test != end; ++test)
                found.insert((*test)[1].str() + "." + (*test)[2].str());
            for (std::sregex_iterator made(text.begin(), text.end(), suite), end; made != end; ++made)
                prefixes.emplace((*made)[2].str(), (*made)[1].str());
        }
        for (const std::string& name : std::set(found)) {
            const auto [begin, end] = prefixes.equal_range(name.substr(0, name.find('.')));
            for (auto made = begin; made != end; ++made) found.insert(made->second + "/" + name + "/0");
        }
        return found;
    }();
    return names;
}

std::string folderOfTarget(const std::string& target) {
    static const std::map<std::string, std::string> folders = [] {
        const std::regex call("(?:add_executable|add_library|add_custom_target|lc_\\w+)\\(\\s*([A-Za-z_]\\w*)");
        std::map<std::string, std::string> found;
        for (const std::string& path : treeFiles()) {
            if (!path.ends_with("CMakeLists.txt")) continue;
            const std::string text = fileText(path);
            for (std::sregex_iterator made(text.begin(), text.end(), call), end; made != end; ++made)
                found.emplace((*made)[1].str(), fs::path(path).parent_path().string());
        }
        return found;
    }();
    const auto folder = folders.find(target);
    return folder == folders.end() ? "" : folder->second;
}

}  // namespace lumacast::docs
