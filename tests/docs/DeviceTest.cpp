// docs/on-a-device.md: the lines, paths and settings that it names are those of the code.

#include <gtest/gtest.h>

#include <algorithm>
#include <regex>

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

/// The last name of a path of the administrator's, where the code, the unit or the packages have it.
bool isPathOfTheSystem(const std::string& path) {
    static const std::string all = textBelow("linux", {".cpp", ".h", ".txt"}) + textBelow("src", {".cpp", ".h"}) +
                                   textBelow("packaging", {".service", ".conf", ".txt", ".md", ".desktop"});
    const auto slash = path.rfind('/');
    return all.find(path.substr(slash + 1)) != std::string::npos;
}

TEST(OnADevice, NamesPathsOfTheAdministratorThatAreRead) {
    std::size_t paths = 0;
    for (const Span& span : devicePage().spans) {
        if (!span.text.starts_with("/etc/")) continue;
        ++paths;
        std::string path = span.text;
        if (path.ends_with("/*.conf")) path.resize(path.size() - 7);
        EXPECT_TRUE(isPathOfTheSystem(path)) << at(devicePage(), span.line) << span.text;
    }
    EXPECT_GT(paths, 4u);
    EXPECT_FALSE(isPathOfTheSystem("/etc/lumacast/no-such-file.conf"));
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
