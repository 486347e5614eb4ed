// Preferences: the user's file and the administrator's, with a zero byte between. They are read from the disk, as the
// daemon does.

#include <chrono>
#include <cmath>
#include <cstdio>

#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "fuzz/Settings.h"
#include "linux/system/IniFile.h"
#include "linux/system/LinuxPreferences.h"
#include "tests/fakes/FakeDeviceInfo.h"
#include "writer/MovieSettings.h"

namespace lumacast::fuzz {

namespace {

constexpr std::size_t kKeysAsked = 3;  // of each file, besides the daemon's own

std::string printed(const Value& value) {
    if (const auto* flag = value.as<bool>()) return *flag ? "true" : "false";
    if (const auto* number = value.as<std::int64_t>()) return std::to_string(*number);
    if (const auto* number = value.as<double>()) {
        char text[64];
        std::snprintf(text, sizeof text, "%.17e", *number);
        return text;
    }
    return '"' + *value.as<std::string>() + '"';
}

void checkValue(std::string_view text) {
    const Value value = iniValue(text);
    const auto* number = value.as<double>();
    require(value.as<bool>() || value.as<std::int64_t>() || number || value.as<std::string>(),
            "a preference is a bool, a number or a text");
    require(!number || std::isfinite(*number), "a number is finite");
    if (const auto* string = value.as<std::string>())
        require(*string == text || '"' + *string + '"' == text, "a text is what was written, or what was quoted");
    require(iniValue(printed(value)) == value, "a printed preference reads as the same preference");
}

std::string printed(const IniFile& file) {
    std::string result = "# printed\n";  // a byte order mark is none after this
    for (const IniSection& section : file.sections) {
        if (!section.name.empty()) result += "[" + section.name + "]\r\n";
        for (const auto& [key, text] : section.entries) result += key + " = " + text + "\n";
    }
    return result;
}

void checkFile(std::string_view text) {
    const IniFile file = IniFile::parse(text);
    const auto entries = plainEntries(text);
    require(!file.sections.empty() && file.sections[0].name.empty(), "the first section has no name");
    require(file.sections[0].entries == entries, "what stands before any section is found");
    std::size_t bytes = 0;
    for (const IniSection& section : file.sections) {
        require(file.section(section.name) == &section, "sections of the same name are one");
        for (const auto& [key, value] : section.entries) {
            bytes += key.size() + value.size();
            const std::string* last = file.find(section.name, key);
            require(last && *last == *lastOf(section.entries, key), "the last value of a key counts");
            checkValue(value);
        }
    }
    require(bytes <= text.size(), "entries are parts of the file");

    const IniFile again = IniFile::parse(printed(file));
    require(again.sections.size() == file.sections.size(), "a printed file has the same sections");
    for (std::size_t i = 0; i < file.sections.size(); ++i)
        require(
            again.sections[i].name == file.sections[i].name && again.sections[i].entries == file.sections[i].entries,
            "a printed file reads as the same file");
}

struct Reader {
    SettingsFolder folder{"lumacast/" + std::string(kPreferenceDomain) + ".conf"};
    LinuxPreferences preferences{folder.directories(), std::chrono::minutes(1)};
};

}  // namespace

void preferences(Bytes input) {
    const auto [users, administrators] = twoFiles(input);
    checkFile(users);
    checkFile(administrators);

    static Reader reader;
    reader.folder.write(users, administrators);
    const auto usersEntries = plainEntries(users), administratorsEntries = plainEntries(administrators);
    std::vector<std::string> keys{"LCSuppressAlert", "LCFullResCapture", "LCBitRateOverride"};
    for (const auto* entries : {&usersEntries, &administratorsEntries})
        for (std::size_t i = 0; i < std::min(entries->size(), kKeysAsked); ++i) keys.push_back((*entries)[i].first);
    for (const std::string& key : keys) {
        const std::string* expected = lastOf(usersEntries, key);
        if (!expected) expected = lastOf(administratorsEntries, key);
        const auto value = reader.preferences.value(kPreferenceDomain, key);
        require(value.has_value() == (expected != nullptr), "a key is found when a file has it");
        require(!value || *value == iniValue(*expected), "the user's file goes before the administrator's");
    }
    // No preference breaks whoever uses it.
    (void)averageVideoBitRate(reader.preferences, FakeDeviceInfo(), {640, 360});
}

}  // namespace lumacast::fuzz
