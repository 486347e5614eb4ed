// The shells' completions know what the tool's help tells, and bash's works.

#include <map>
#include <set>
#include <sstream>

#include "tests/unit/lumacastctl/FindingMatchers.h"
#include "tests/unit/lumacastctl/ToolFixture.h"

namespace lumacast::ctl {
namespace {

using ::testing::ElementsAre;
using ::testing::UnorderedElementsAre;

constexpr char kFolder[] = LC_SOURCE_DIR "/client/lumacastctl/completions/";

/// What a help text lists: the first word of each indented line below a heading that begins so.
std::set<std::string> listedBelow(const std::string& help, const std::string& heading) {
    std::set<std::string> words;
    std::istringstream lines(help);
    bool isBelow = false;
    for (std::string line; std::getline(lines, line);) {
        if (!line.empty() && line[0] != ' ') isBelow = line.starts_with(heading);
        else if (isBelow && line.size() > 2 && line[2] != ' ') {
            std::istringstream names(line.substr(0, line.find(' ', 2)));
            for (std::string name; std::getline(names, name, ',');) {
                name.erase(0, name.find_first_not_of(' '));
                words.insert(name);
            }
        }
    }
    return words;
}

class Completion : public Tool {
protected:
    /// Every command, as its words, with what its help lists.
    std::map<std::vector<std::string>, std::set<std::string>> helps() {
        std::map<std::vector<std::string>, std::set<std::string>> all;
        collect({}, all);
        return all;
    }
    /// What bash offers after `words`, of which the last one is begun.
    std::vector<std::string> bashOffers(const std::vector<std::string>& words) {
        std::string script = "source '" + std::string(kFolder) + "lumacastctl.bash'\nCOMP_WORDS=(lumacastctl";
        for (const std::string& word : words) script += " '" + word + "'";
        script += ")\nCOMP_CWORD=" + std::to_string(words.size()) +
                  "\n[ \"$(complete -p lumacastctl)\" = 'complete -F _lumacastctl lumacastctl' ] || exit 1\n" +
                  "_lumacastctl\nprintf '%s\\n' \"${COMPREPLY[@]}\"\n";
        const std::string file = scratch_.write("complete.bash", script);
        std::vector<std::string> offers;
        std::FILE* output = ::popen(("/bin/bash --norc " + file).c_str(), "r");
        EXPECT_TRUE(output);
        if (!output) return offers;
        std::string text;
        for (int byte = std::fgetc(output); byte != EOF; byte = std::fgetc(output)) text += static_cast<char>(byte);
        EXPECT_EQ(::pclose(output), 0);
        std::istringstream lines(text);
        for (std::string line; std::getline(lines, line);)
            if (!line.empty()) offers.push_back(line);
        return offers;
    }

private:
    void collect(const std::vector<std::string>& words,
                 std::map<std::vector<std::string>, std::set<std::string>>& all) {
        std::vector<std::string> question = words;
        question.push_back("--help");
        const std::string help = run(question).out;
        std::set<std::string> listed = listedBelow(help, "Options:");
        const std::set<std::string> commands = listedBelow(help, "Subcommands:");
        listed.insert(commands.begin(), commands.end());
        EXPECT_FALSE(listed.empty()) << help;
        all[words] = listed;
        for (const std::string& command : commands) {
            std::vector<std::string> below = words;
            below.push_back(command);
            collect(below, all);
        }
    }
};

TEST_F(Completion, TheHelpIsReadAsItStands) {
    const auto all = helps();
    EXPECT_EQ(all.size(), 12u);
    EXPECT_THAT(all.at({}), UnorderedElementsAre("-h", "--help", "status", "doctor", "storage", "save", "usage", "record", "extensions", "broadcast"));
    EXPECT_THAT(all.at({"save"}), UnorderedElementsAre("-h", "--help", "--json"));
    EXPECT_THAT(all.at({"status"}), UnorderedElementsAre("-h", "--help", "--json", "--watch"));
    EXPECT_THAT(all.at({"storage"}), UnorderedElementsAre("-h", "--help", "--json", "list", "purgeable", "purge"));
}

TEST_F(Completion, BashOffersExactlyWhatTheHelpLists) {
    for (const auto& [command, listed] : helps()) {
        SCOPED_TRACE(::testing::PrintToString(command));
        std::vector<std::string> words = command;
        words.emplace_back("");
        const std::vector<std::string> offers = bashOffers(words);
        std::set<std::string> offered(offers.begin(), offers.end());
        if (!command.empty() && command.back() == "purge") {
            for (const char* urgency : {"1", "2", "3"}) EXPECT_EQ(offered.erase(urgency), 1u);
        }
        EXPECT_EQ(offered, listed);
    }
}

TEST_F(Completion, EachShellsFileNamesAllOfIt) {
    for (const auto& [command, listed] : helps())
        for (const std::string& word : listed) {
            const std::string bare = word.substr(word.find_first_not_of('-'));
            const bool isOption = word.starts_with("-");
            const std::string zsh = ScratchDirectory::read(std::string(kFolder) + "_lumacastctl");
            const std::string fish = ScratchDirectory::read(std::string(kFolder) + "lumacastctl.fish");
            EXPECT_NE(zsh.find(isOption ? word : word + "\\:\""), std::string::npos) << word;
            EXPECT_NE(fish.find((!isOption               ? "-a "
                                 : word.starts_with("--") ? "-l "
                                                          : "-s ") +
                                bare + " "),
                      std::string::npos)
                << word;
            if (word != "-h" && word != "--help" && isOption && !command.empty()) {
                EXPECT_NE(fish.find("__fish_seen_subcommand_from " + command[0] + "' -l " + bare), std::string::npos)
                    << command[0] << " " << word;
            }
        }
}

TEST_F(Completion, BashCompletesBegunWordsAndValues) {
    EXPECT_THAT(bashOffers({"st"}), UnorderedElementsAre("status", "storage"));
    EXPECT_THAT(bashOffers({"status", "--w"}), ElementsAre("--watch"));
    EXPECT_THAT(bashOffers({"status", "--json", "--"}), UnorderedElementsAre("--json", "--watch", "--help"));
    EXPECT_THAT(bashOffers({"storage", "--json", "purg"}), UnorderedElementsAre("purgeable", "purge"));
    EXPECT_THAT(bashOffers({"storage", "purge", "3"}), ElementsAre("3"));
    EXPECT_THAT(bashOffers({"nonsense", "x"}), ElementsAre());
    scratch_.write("movies/a movie.mp4", "");
    EXPECT_THAT(bashOffers({"save", scratch_.path("movies/a")}), ElementsAre(scratch_.path("movies/a movie.mp4")));
    EXPECT_THAT(bashOffers({"save", "--j"}), ElementsAre("--json"));
    scratch_.write("programs/player", "");
    EXPECT_THAT(bashOffers({"doctor", "--exe", scratch_.path("programs/pl")}),
                ElementsAre(scratch_.path("programs/player")));
    EXPECT_THAT(bashOffers({"doctor", "--pid", std::to_string(::getpid())}),
                ::testing::Contains(std::to_string(::getpid())));
}

}  // namespace
}  // namespace lumacast::ctl
