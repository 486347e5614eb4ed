// docs/on-a-device.md: the lines, paths and settings that it names are those of the code.

#include <gtest/gtest.h>

#include <algorithm>
#include <regex>
#include <set>

#include "base/Limits.h"
#include "linux/storage/LinuxFileSystem.h"
#include "linux/system/LinuxEnvironment.h"
#include "tests/docs/Markdown.h"
#include "tests/docs/SourceTree.h"
#include "tests/tables/Tables.h"

namespace lumacast::docs {
namespace {

const Page& devicePage() {
    return docs::page("docs/on-a-device.md");
}

TEST(OnADevice, NamesLinesThatTheDaemonLogs) {
    const std::string all = tables::logPage();
    std::size_t lines = 0;
    for (const std::string& line : sectionOf(devicePage(), "## Lines to watch")) {
        const auto cells = cellsOf(line);
        if (cells.size() != 3 || cells[0] == "line") continue;
        ++lines;
        EXPECT_NE(all.find("| " + cells[0] + " |"), std::string::npos) << cells[0] << " is no line of the log";
    }
    EXPECT_GT(lines, 8u);
}

/// Settings as pages write them, "Root=", and whether the port reads one of this name.
bool isSetting(const std::string& key) {
    static const std::string port = textBelow("linux", {".cpp"}) + textBelow("src", {".cpp", ".h"}) +
                                    fileText("packaging/systemd/lumacastd@.service");
    return port.find("\"" + key + "\"") != std::string::npos || port.find("\n" + key + "=") != std::string::npos;
}

TEST(OnADevice, NamesSettingsThatAreRead) {
    static const std::regex kSetting("([A-Z][A-Za-z]+)=\\S*");
    std::size_t settings = 0;
    for (const Span& span : devicePage().spans) {
        std::smatch match;
        if (!std::regex_match(span.text, match, kSetting)) continue;
        ++settings;
        EXPECT_TRUE(isSetting(match[1].str())) << at(devicePage(), span.line) << span.text << " is read nowhere";
    }
    EXPECT_GT(settings, 6u);
    EXPECT_FALSE(isSetting("NoSuchSetting"));
}

LinuxEnvironment environmentOf(std::initializer_list<std::pair<std::string_view, std::string_view>> variables) {
    const auto value = [&](std::string_view name) -> std::optional<std::string> {
        for (const auto& [key, text] : variables)
            if (key == name) return std::string(text);
        return std::nullopt;
    };
    return LinuxEnvironment::from(value, 1000, "/usr/bin/lumacastd", "/nonexistent");
}

bool hasSpan(const std::string& text) {
    const auto& spans = devicePage().spans;
    return std::any_of(spans.begin(), spans.end(), [&](const Span& span) { return span.text == text; });
}

TEST(OnADevice, NamesTheFoldersThatTheDaemonUses) {
    const LinuxEnvironment own = environmentOf({{"XDG_RUNTIME_DIR", "/$XDG_RUNTIME_DIR"},
                                                {"XDG_STATE_HOME", "/$XDG_STATE_HOME"},
                                                {"XDG_CACHE_HOME", "/$XDG_CACHE_HOME"}});
    for (const std::string& path : {own.runtimeDirectory, own.root, own.stateDirectory + "/telemetry.jsonl",
                                    own.stateDirectory + "/extension-data", own.cacheDirectory})
        EXPECT_TRUE(hasSpan(path.substr(1))) << path;
    // As the service unit sets the variables, for the user 1000.
    const std::string unit = fileText("packaging/systemd/lumacastd@.service");
    for (const char* setting : {"XDG_RUNTIME_DIR=/run/user/%i", "XDG_STATE_HOME=/var/lib/lumacast/%i",
                                "XDG_CACHE_HOME=/var/cache/lumacast/%i"})
        EXPECT_NE(unit.find(setting), std::string::npos) << setting;
    const LinuxEnvironment service = environmentOf({{"XDG_RUNTIME_DIR", "/run/user/1000"},
                                                    {"XDG_STATE_HOME", "/var/lib/lumacast/1000"},
                                                    {"XDG_CACHE_HOME", "/var/cache/lumacast/1000"}});
    for (const std::string& path : {service.runtimeDirectory, service.root, service.stateDirectory + "/telemetry.jsonl",
                                    service.stateDirectory + "/extension-data", service.cacheDirectory})
        EXPECT_TRUE(hasSpan(path)) << path;
    EXPECT_TRUE(hasSpan(std::string(kDeviceTemporaryDirectory)));
}

constexpr std::string_view kAdministratorsFolder = "/etc/lumacast";

/// Whether one of these texts has `name` as a path below a folder: in the code the whole literal, in a unit the path.
bool isReadBelow(const std::string& name) {
    static const std::string code = textBelow("linux", {".cpp"});
    static const std::string unit = fileText("packaging/systemd/lumacastd@.service");
    return code.find("directory + \"/" + name + "\"") != std::string::npos ||
           code.find("below(environment.systemDirectories, \"" + name + "\")") != std::string::npos ||
           unit.find("EnvironmentFile=-" + std::string(kAdministratorsFolder) + "/" + name + "\n") != std::string::npos;
}

TEST(OnADevice, NamesPathsOfTheAdministratorThatAreRead) {
    const auto nothing = [](std::string_view) -> std::optional<std::string> { return std::nullopt; };
    EXPECT_EQ(LinuxEnvironment::from(nothing, 1000, "/usr/bin/lumacastd").systemDirectories.front(),
              kAdministratorsFolder);
    const std::string below = std::string(kAdministratorsFolder) + "/";
    std::set<std::string> named;
    for (const Span& span : devicePage().spans) {
        if (!span.text.starts_with("/etc/") || span.text == kAdministratorsFolder) continue;
        std::string name = span.text;
        if (name.ends_with("/*.conf")) name.resize(name.size() - 7);
        ASSERT_TRUE(name.starts_with(below)) << at(devicePage(), span.line) << span.text;
        name.erase(0, below.size());
        named.insert(name);
        EXPECT_TRUE(isReadBelow(name)) << at(devicePage(), span.line) << span.text << " is read nowhere";
    }
    EXPECT_EQ(named, (std::set<std::string>{"daemon.conf", "device.conf", "entitlements.d", "environment"}))
        << "what the administrator may write";
    // Names that stand in the code, but are read from no folder of the administrator's.
    for (const char* name : {"conf", "device", "machine-id", "resolv.conf", "entitlements"})
        EXPECT_FALSE(isReadBelow(name)) << name;
}

TEST(OnADevice, NamesTheCommandsOfTheAdministratorsSocket) {
    const std::string code = textBelow("src", {".cpp"}) + textBelow("linux", {".cpp"});
    for (const char* command : {"storage", "movies", "purge", "save", "usage"}) {
        EXPECT_TRUE(hasSpan(command)) << command;
        EXPECT_TRUE(std::regex_search(code, std::regex("addCommand\\(\\s*\"" + std::string(command) + "\"")))
            << command;
    }
    const std::regex any("addCommand\\(\\s*\"");
    EXPECT_EQ(std::distance(std::sregex_iterator(code.begin(), code.end(), any), std::sregex_iterator()), 5)
        << "there is a command that the page doesn't name";
}

TEST(OnADevice, NamesTheLevelsOfFreeSpace) {
    const std::string text = devicePage().text;
    EXPECT_EQ(kPurgeLevels[0].freeBytesBelow, 1'000'000'000u);
    EXPECT_EQ(kPurgeLevels[1].freeBytesBelow, 500'000'000u);
    EXPECT_EQ(kPurgeLevels[2].freeBytesBelow, 100'000'000u);
    for (const char* level : {"less than 1 GB", "less than 500 MB", "less than 100 MB"})
        EXPECT_NE(text.find(level), std::string::npos) << level;
}

}  // namespace
}  // namespace lumacast::docs
