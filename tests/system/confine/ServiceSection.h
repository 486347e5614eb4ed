#pragma once
// The [Service] section of a unit and its drop-ins.

#include <cstdlib>
#include <fstream>
#include <set>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

namespace lumacast::test {

[[noreturn]] inline void fail(const std::string& reason) {
    (void)!::write(2, ("confine: " + reason + "\n").c_str(), reason.size() + 10);
    ::_exit(64);
}

/// What a unit asks for, with %i filled in and some places moved (a test has no /run/user of its own). What nobody has
/// taken at the end is something that this program can't do.
class ServiceSection final {
public:
    ServiceSection(std::string instance, std::vector<std::pair<std::string, std::string>> moved)
        : instance_(std::move(instance)), moved_(std::move(moved)) {}

    void read(const std::string& path) {
        std::ifstream file(path);
        if (!file) fail(path + " can't be read");
        bool inSection = false;
        for (std::string line; std::getline(file, line);) {
            if (line.empty() || line[0] == '#') continue;
            if (line[0] == '[') inSection = line == "[Service]";
            const auto equals = line.find('=');
            if (!inSection || equals == std::string::npos) continue;
            settings_.emplace_back(line.substr(0, equals), expanded(line.substr(equals + 1)));
        }
    }

    /// All values of a setting, each split at blanks; an empty one is one empty list.
    std::vector<std::vector<std::string>> all(const std::string& name) {
        std::vector<std::vector<std::string>> values;
        taken_.insert(name);
        for (const auto& [key, value] : settings_) {
            if (key != name) continue;
            std::istringstream text(value);
            values.emplace_back();
            for (std::string word; text >> word;) values.back().push_back(word);
        }
        return values;
    }
    std::vector<std::string> words(const std::string& name) {
        std::vector<std::string> result;
        for (const auto& words : all(name)) result.insert(result.end(), words.begin(), words.end());
        return result;
    }
    /// The last one counts; empty when there is none.
    std::string one(const std::string& name) {
        const auto values = all(name);
        return values.empty() || values.back().empty() ? "" : values.back().front();
    }
    bool isOn(const std::string& name) { return one(name) == "yes"; }
    bool has(const std::string& name) { return !all(name).empty(); }
    std::string moved(std::string path) const {
        for (const auto& [from, to] : moved_)
            if (path == from || path.starts_with(from + "/")) return to + path.substr(from.size());
        return path;
    }
    const std::vector<std::pair<std::string, std::string>>& moves() const { return moved_; }

    void failOnWhatIsLeft() const {
        for (const auto& [key, value] : settings_)
            if (!taken_.contains(key)) fail("doesn't know how to apply " + key + "=" + value);
    }

private:
    std::string expanded(std::string text) const {
        for (auto at = text.find("%i"); at != std::string::npos; at = text.find("%i", at))
            text.replace(at, 2, instance_);
        return text;
    }

    const std::string instance_;
    const std::vector<std::pair<std::string, std::string>> moved_;
    std::vector<std::pair<std::string, std::string>> settings_;
    std::set<std::string> taken_;
};

}  // namespace lumacast::test
