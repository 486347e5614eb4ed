// The manual pages name what the tool's help lists and what the code reads, no more and no less.

#include <gmock/gmock.h>

#include <map>
#include <regex>
#include <set>
#include <sstream>

#include "platform/PreferenceKeys.h"
#include "tests/unit/lumacastctl/ToolFixture.h"

namespace lumacast::ctl {
namespace {

using Words = std::set<std::string>;

std::string source(const std::string& file) { return ScratchDirectory::read(LC_SOURCE_DIR "/" + file); }
std::string page(const std::string& name) { return source("packaging/man/" + name); }

/// What the first group of `pattern` matches, everywhere.
Words all(const std::string& text, const std::string& pattern) {
    Words found;
    const std::regex expression(pattern);
    for (std::sregex_iterator at(text.begin(), text.end(), expression), end; at != end; ++at) found.insert((*at)[1]);
    return found;
}

/// What a page has from one line on to another.
std::string between(const std::string& text, const std::string& from, const std::string& to) {
    const auto begin = text.find(from);
    if (begin == std::string::npos) return "";
    return text.substr(begin, text.find(to, begin + from.size()) - begin);
}

class ManualPage : public Tool {
protected:
    /// The long options that a command and those below it list, but for --help.
    Words optionsOf(std::vector<std::string> command) {
        command.emplace_back("--help");
        const std::string help = run(command).out;
        Words options = all(help, "\n +(?:-h,)?--([a-z]+)");
        command.pop_back();
        for (const std::string& below : all(between(help, "\nSubcommands:", "\nExit"), "\n  ([a-z]+) ")) {
            auto further = command;
            further.push_back(below);
            options.merge(optionsOf(further));
        }
        options.erase("help");
        return options;
    }
};

TEST_F(ManualPage, OfTheToolHasEveryCommandWithItsOptions) {
    std::map<std::string, Words> written;
    std::istringstream lines(page("lumacastctl.1"));
    std::string command;
    std::smatch match;
    for (std::string line; std::getline(lines, line);) {
        if (std::regex_search(line, match, std::regex("^\\.It (?:Xo )?Cm ([a-z]+)"))) written[command = match[1]];
        else if (line.starts_with(".It") || line.starts_with(".El")) command.clear();
        if (!command.empty()) written[command].merge(all(line, "Fl -([a-z]+)"));
    }
    std::map<std::string, Words> helped;
    for (const std::string& name : all(between(run({"--help"}).out, "\nSubcommands:", "\nExit"), "\n  ([a-z]+) "))
        helped[name] = optionsOf({name});
    EXPECT_EQ(helped.size(), 8u);
    EXPECT_EQ(written, helped);
}

TEST_F(ManualPage, OfTheToolHasEveryExitStatus) {
    const Words statuses = all(between(run({"--help"}).out, "\nExit status:", "\xff"), "\n  ([0-9])");
    EXPECT_EQ(statuses.size(), 7u);
    EXPECT_EQ(all(between(page("lumacastctl.1"), ".Sh EXIT STATUS", ".El"), "\\.It ([0-9])"), statuses);
}

TEST(Manual, OfPreferencesHasTheKeysThatAreRead) {
    Words read;
    for (const PreferenceRow& row : kPreferenceTable) read.emplace(row.key);
    const std::string text = page("lumacast.conf.5");
    EXPECT_EQ(all(between(text, ".Ss com", ".Ss daemon.conf"), "It Cm ([A-Za-z]+)"), read);
    Words settings = all(source("linux/system/LinuxEnvironment.cpp"), "find\\(\"\", \"([A-Za-z]+)\"");
    settings.merge(all(source("linux/extensions/Sandbox.cpp"), "find\\(\"\", \"([A-Za-z]+)\""));
    EXPECT_EQ(settings.size(), 2u);
    EXPECT_EQ(all(between(text, ".Ss daemon", ".Ss device"), "It Cm ([A-Za-z]+)"), settings);
    const std::string device = between(text, ".Ss device", ".Sh SEE");
    Words keys = all(source("linux/system/LinuxDeviceInfo.cpp"), "number\\(\"([A-Za-z]+)\"");
    EXPECT_EQ(keys.size(), 3u);
    EXPECT_EQ(all(device, "(?:Cm|,) ([A-Z][A-Za-z]+)"), keys);
}

TEST(Manual, OfAnExtensionsManifestHasTheEntriesThatAreRead) {
    const std::string code = source("linux/extensions/ExtensionManifest.cpp");
    Words read = all(code, "(?:textIn\\(\\*entries, |entries->find\\(|key == )\"([A-Za-z]+)\"");
    read.insert("displayName");  // with its languages it is read by a pattern
    EXPECT_EQ(read.size(), 11u);
    EXPECT_EQ(all(page("lumacast-extension.5"), "\n\\.It Cm ([A-Za-z]+)"), read);
    EXPECT_NE(code.find("displayName"), std::string::npos);
}

TEST(Manual, OfTheDaemonNamesVariablesThatAreRead) {
    std::string code;
    for (const char* file : {"linux/platform/LinuxPlatform.cpp", "linux/LinuxDesktop.cpp", "linux/system/LinuxEnvironment.cpp",
                             "linux/audio/ServerWatch.cpp", "linux/display/AuthorityFile.cpp"})
        code += source(file);
    const Words named =
        all(between(page("lumacastd.1"), "\n.Bl", ".Sh FILES"), "[, ](?:Ev )?([A-Z][A-Z_]{3,}[A-Z])\\b");
    EXPECT_GT(named.size(), 12u);
    for (const std::string& name : named)
        EXPECT_NE(code.find("\"" + name + "\""), std::string::npos) << name << " is read nowhere";
}

}  // namespace
}  // namespace lumacast::ctl
