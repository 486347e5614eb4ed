// Every command that a page shows names scripts, programs and options that exist; those of lumacastctl are asked of the
// tool.

#include <gtest/gtest.h>

#include <map>
#include <regex>
#include <set>

#include "client/lumacastctl/ExitStatus.h"
#include "tests/checkers/tests/Child.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/docs/Commands.h"
#include "tests/docs/SourceTree.h"

namespace lumacast::docs {
namespace {

/// The tool as it is built, in a user's directories of the test's own, where no daemon runs.
class LumacastCtl {
public:
    LumacastCtl() {
        for (const char* name : {"run", "config", "data", "state"}) scratch_.makeDirectory(name);
    }

    /// What it says to a command line that it doesn't understand; empty for one that it does.
    std::string wrongUsageOf(const Command& command) {
        std::vector<std::string> words{"timeout", "60", LC_CTL};
        for (std::size_t i = 1; i < command.words.size(); ++i) words.push_back(filledIn(command.words[i]));
        std::string complaint = complaintOf(words);
        // "`lumacastctl save` saves": a sentence may leave out what must be given, but no name may be wrong.
        if (command.isProse && command.words.size() == 2 && complaint.find(" required") != std::string::npos) {
            words.emplace_back("--help");
            complaint = complaintOf(words);
            if (printed_.find("lumacastctl " + command.words[1]) == std::string::npos) complaint = "no such command";
        }
        return complaint;
    }

private:
    static std::string filledIn(const std::string& word) {
        static const std::map<std::string, std::string> kExamples{
            {"URGENCY", "1"}, {"FILE", "movie.mp4"},     {"SECONDS", "5"},
            {"N", "1"},       {"PATH", "/usr/bin/true"}, {"IDENTIFIER", "org.example.Upload"},
            {"PID", "1"}};
        const auto example = kExamples.find(word);
        return example == kExamples.end() ? word : example->second;
    }

    std::string complaintOf(const std::vector<std::string>& words) {
        const std::string errors = scratch_.path("errors");
        checkers::Child tool(words,
                             {"HOME=" + scratch_.path(), "XDG_RUNTIME_DIR=" + scratch_.path("run"),
                              "DISPLAY=", "PULSE_SERVER=", "XDG_CONFIG_HOME=" + scratch_.path("config"),
                              "XDG_DATA_HOME=" + scratch_.path("data"), "XDG_STATE_HOME=" + scratch_.path("state")},
                             errors);
        printed_ = tool.readAll();
        if (tool.wait() != ctl::kWrongUsage) return {};
        return "wrong usage: " + ScratchDirectory::read(errors);
    }

    const ScratchDirectory scratch_;
    std::string printed_;
};

TEST(Commands, NameProgramsAndOptionsThatExist) {
    std::size_t commands = 0;
    for (const Page& page : allPages())
        for (const Command& command : commandsOf(page)) {
            ++commands;
            EXPECT_EQ(faultOf(command), "") << command.where;
        }
    EXPECT_GT(commands, 60u) << "the pages were not found";
}

TEST(Commands, OfCIAreTheOnesThatThePagesName) {
    const std::string script = fileText(".ci/run"), exec = "\nexec ";
    ASSERT_NE(script.find(exec), std::string::npos);
    const std::string command = script.substr(script.find(exec) + exec.size());
    const std::string named = "`" + command.substr(0, command.find('\n')) + "`";
    EXPECT_NE(docs::page("docs/maintaining.md").text.find("`.ci/run`, which is " + named), std::string::npos) << named;
    const std::string option =
        "`" + command.substr(command.rfind("--"), command.find('\n') - command.rfind("--")) + "`";
    EXPECT_NE(docs::page("README.md").text.find(option + " is what\nCI runs"), std::string::npos) << option;
}

/// "lumacastd@1000.service" and "lumacastd@<number>.service" are made of the unit lumacastd@.service.
bool isInstalledUnit(const std::string& instance, const std::string& kind) {
    const std::string name = (instance.empty() ? "lumacastd." : "lumacastd@.") + kind;
    return isThere("packaging/systemd/" + name) || isThere("packaging/systemd/user/" + name);
}

TEST(Commands, NameUnitsThatAreInstalled) {
    static const std::regex kUnit("lumacastd(@[\\w%]*)?\\.(service|socket|target|timer)\\b");
    std::size_t units = 0;
    for (const Page& page : allPages())
        for (auto unit = std::sregex_iterator(page.text.begin(), page.text.end(), kUnit);
             unit != std::sregex_iterator(); ++unit, ++units)
            EXPECT_TRUE(isInstalledUnit((*unit)[1], (*unit)[2])) << page.path << ": " << unit->str();
    EXPECT_GT(units, 6u);
    EXPECT_FALSE(isInstalledUnit("", "timer"));
    EXPECT_FALSE(isInstalledUnit("@1000", "socket"));
}

TEST(Commands, OfLumacastctlAreUnderstoodByIt) {
    LumacastCtl tool;
    std::set<std::vector<std::string>> tried;
    for (const Page& page : allPages())
        for (const Command& command : commandsOf(page))
            if (command.words[0] == "lumacastctl" && tried.insert(command.words).second) {
                EXPECT_EQ(tool.wrongUsageOf(command), "") << command.where;
            }
    EXPECT_GT(tried.size(), 15u);
}

/// All that is wrong with what a planted page shows.
std::size_t faultsIn(const std::string& text, const std::string& path = "docs/planted.md") {
    std::size_t faults = 0;
    LumacastCtl tool;
    for (const Command& command : commandsOf(pageOf(path, text)))
        if (!faultOf(command).empty() || (command.words[0] == "lumacastctl" && !tool.wrongUsageOf(command).empty()))
            ++faults;
    return faults;
}

TEST(Commands, ThatDoNotExistAreSeen) {
    EXPECT_EQ(faultsIn("```sh\nscripts/test --asan\nLC_SEED=1 scripts/simulate --seeds 3\n```\n"), 0u);
    EXPECT_EQ(faultsIn("```sh\nscripts/test --no-such-kind\n```\n"), 1u);
    EXPECT_EQ(faultsIn("```sh\nscripts/no-such-script\n```\n"), 1u);
    EXPECT_EQ(faultsIn("```sh\nno-such-program\n```\n"), 1u);
    EXPECT_EQ(faultsIn("```sh\nscripts/test && no-such-program\n```\n"), 1u);
    EXPECT_EQ(faultsIn("```sh\ngdb --args build/release/bin/unit_tests --gtest_filter='NoSuchSuite.*'\n```\n"), 1u);
    EXPECT_EQ(faultsIn("```\nno command but a drawing\n```\n"), 0u);
    EXPECT_EQ(faultsIn("text\n\n    scripts/test --no-such-kind   with an explanation\n"), 1u);
    EXPECT_EQ(faultsIn("Say `scripts/test --no-such-kind`.\n"), 1u);
    EXPECT_EQ(faultsIn("```sh\ncmake --preset release\nninja -C build/release lumacastd\n```\n"), 0u);
    EXPECT_EQ(faultsIn("```sh\ncmake --preset no-such-preset\nninja -C build/release no_such_target\n```\n"), 2u);
    EXPECT_EQ(faultsIn("```sh\ncmake -S . -B build/planted -DLC_NO_SUCH_OPTION=ON\n```\n"), 1u);
    EXPECT_EQ(faultsIn("```sh\nbuild/release/bin/unit_tests --gtest_filter='Texts.*'\n```\n"), 0u);
    EXPECT_EQ(faultsIn("```sh\nbuild/release/bin/unit_tests --gtest_filter='NoSuchSuite.*'\n```\n"), 1u);
    EXPECT_EQ(faultsIn("```sh\nbuild/release/bin/no_such_tests\n```\n"), 1u);
}

TEST(Commands, OfTheSystemThatNoCheckRunsAreSeen) {
    const std::string shown = "```sh\nsystemctl --user status lumacastd.socket lumacastd.service\n```\n";
    EXPECT_EQ(faultsIn(shown, "docs/on-a-device.md"), 0u);
    EXPECT_EQ(faultsIn(shown, "docs/planted.md"), 1u) << "each page's own is to be run";
    EXPECT_EQ(faultsIn("```sh\nsystemctl --user sing\n```\n", "docs/on-a-device.md"), 1u);
    EXPECT_EQ(faultsIn("```sh\nscripts/demo && systemctl start lumacastd\n```\n"), 1u);
    EXPECT_EQ(faultsIn("```sh\n$HOME/bin/recorder movie.mp4\n```\n"), 1u);
    EXPECT_EQ(faultsIn("text\n\n    mkdir -p /etc/planted\n"), 1u);
    EXPECT_EQ(faultsIn("text\n\n    $ cmake --install build/release\n"), 1u);
}

TEST(Commands, ThatLumacastctlDoesNotUnderstandAreSeen) {
    EXPECT_EQ(faultsIn("`lumacastctl save` and `lumacastctl storage purge URGENCY`\n"), 0u);
    EXPECT_EQ(faultsIn("    lumacastctl storage [list | purgeable] [--json]\n"), 0u);
    EXPECT_EQ(faultsIn("    lumacastctl save\n"), 1u) << "what is shown as a command must be whole";
    EXPECT_EQ(faultsIn("`lumacastctl sing`\n"), 1u);
    EXPECT_EQ(faultsIn("`lumacastctl storage purge 0`\n"), 1u);
    EXPECT_EQ(faultsIn("`lumacastctl status --loud`\n"), 1u);
}

}  // namespace
}  // namespace lumacast::docs
