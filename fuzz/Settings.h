#pragma once
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "fuzz/Targets.h"

namespace lumacast::fuzz {

/// A folder on the disk with two small files, for readers that take a path. Made once per process and used for every
/// input; the files are rewritten in place, because making them anew would cost more than reading them.
class SettingsFolder {
public:
    /// `name`: of the file, below each of the two directories.
    explicit SettingsFolder(const std::string& name);
    SettingsFolder(const SettingsFolder&) = delete;
    SettingsFolder& operator=(const SettingsFolder&) = delete;
    ~SettingsFolder();

    /// The user's directory, then the administrator's.
    const std::vector<std::string>& directories() const { return directories_; }
    void write(std::string_view usersFile, std::string_view administratorsFile);

private:
    std::string root_;
    std::vector<std::string> directories_;
    std::vector<int> files_;
};

/// The plainest reading of a settings file there is: the entries before any section, in their order.
std::vector<std::pair<std::string, std::string>> plainEntries(std::string_view file);
/// The last of those for `key`, or null.
const std::string* lastOf(const std::vector<std::pair<std::string, std::string>>& entries, std::string_view key);

/// Two files with a zero byte between.
std::pair<std::string_view, std::string_view> twoFiles(Bytes input);

}  // namespace lumacast::fuzz
