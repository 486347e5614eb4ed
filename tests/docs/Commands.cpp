#include "tests/docs/Commands.h"

#include <fnmatch.h>

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <regex>
#include <set>
#include <utility>

#include "tests/docs/SourceTree.h"

namespace lumacast::docs {

namespace fs = std::filesystem;

namespace {

/// What pages may tell people to run besides what is in the tree. A word that is neither is a mistake, or belongs here;
/// then it is also to be run, as the page shows it, by tests/packages.
const std::set<std::string> kOfTheSystem{"cmake", "echo",   "journalctl", "ls",       "mkdir",
                                         "ninja", "printf", "socat",      "systemctl"};

std::vector<std::string> wordsOf(const std::string& line) {
    std::vector<std::string> words;
    std::string word;
    char quote = 0;
    bool isIn = false;
    for (const char c : line) {
        if (quote == 0 && (c == '\'' || c == '"'))
            quote = c, isIn = true;
        else if (c == quote)
            quote = 0;
        else if (quote == 0 && c == ' ') {
            if (isIn) words.push_back(std::exchange(word, {}));
            isIn = false;
        } else
            word += c, isIn = true;
    }
    if (isIn) words.push_back(word);
    return words;
}

/// "storage [list | purgeable]": "storage", "storage list", "storage purgeable".
std::vector<std::string> choicesOf(const std::string& line) {
    const auto open = line.find('['), close = line.find(']');
    if (open == std::string::npos || close == std::string::npos || close < open) return {line};
    const std::string before = line.substr(0, open), choice = line.substr(open + 1, close - open - 1);
    std::vector<std::string> lines;
    for (const std::string& rest : choicesOf(line.substr(close + 1))) {
        lines.push_back(before + rest);
        if (choice == "options" || choice.starts_with("the ")) continue;
        for (std::size_t from = 0; from <= choice.size();) {
            const auto bar = std::min(choice.find(" | ", from), choice.size());
            lines.push_back(before + choice.substr(from, bar - from) + rest);
            from = bar + 3;
        }
    }
    return lines;
}

/// Where a line's explanation begins, behind two blanks or a number sign.
std::string withoutExplanation(std::string line) {
    for (const char* mark : {"  ", " #"})
        if (const auto end = line.find(mark); end != std::string::npos) line.resize(end);
    return line;
}

std::vector<std::string> partsOf(const std::string& line) {
    std::vector<std::string> parts{""};
    char quote = 0;
    for (std::size_t i = 0; i < line.size(); ++i) {
        if (line[i] == '\'' || line[i] == '"') quote = quote == 0 ? line[i] : quote == line[i] ? '\0' : quote;
        const bool isEnd = quote == 0 && (line[i] == '|' || line[i] == ';' || line.compare(i, 2, "&&") == 0);
        if (isEnd) parts.emplace_back();
        if (isEnd && line[i] == '&') ++i;
        if (!isEnd) parts.back() += line[i];
    }
    return parts;
}

bool isAssignment(const std::string& word) {
    const auto sign = word.find('=');
    return sign != std::string::npos && sign > 0 &&
           std::all_of(word.begin(), word.begin() + static_cast<std::ptrdiff_t>(sign),
                       [](char c) { return (c >= 'A' && c <= 'Z') || c == '_'; });
}

/// The words without what only prepares the command: assignments, `sudo`, a limit of time, a debugger.
std::vector<std::string> stripped(std::vector<std::string> words) {
    while (!words.empty() && (words[0] == "$" || words[0] == "sudo" || words[0] == "exec" || isAssignment(words[0])))
        words.erase(words.begin());
    if (words.size() > 2 && (words[0] == "timeout" || (words[0] == "gdb" && words[1] == "--args")))
        words.erase(words.begin(), words.begin() + 2);
    return words;
}

bool isOfTheTree(const std::string& program) {
    return program.starts_with("scripts/") || program.starts_with("bench/") || program.starts_with(".ci/") ||
           program.starts_with("build/") || program == "lumacastctl" ||
           (program.find('/') == std::string::npos && !kOfTheSystem.contains(program) && program.size() > 3 &&
            program.find_first_not_of("abcdefghijklmnopqrstuvwxyz0123456789_-") == std::string::npos &&
            !folderOfTarget(program).empty());
}

std::string faultOfOptions(const Command& command, const std::string& text) {
    for (std::size_t i = 1; i < command.words.size(); ++i) {
        const std::string option = command.words[i].substr(0, command.words[i].find('='));
        if (!option.starts_with("--") || option.size() == 2 || option == "--help" || option.starts_with("--gtest_"))
            continue;
        if (text.find(option) == std::string::npos) return command.words[0] + " has no option " + option;
    }
    return {};
}

std::string faultOfFilter(const Command& command) {
    constexpr std::string_view kFilter = "--gtest_filter=";
    for (const std::string& word : command.words) {
        if (!word.starts_with(kFilter)) continue;
        const std::string pattern = word.substr(kFilter.size());
        const auto& tests = testNames();
        const auto fits = [&](const std::string& name) { return ::fnmatch(pattern.c_str(), name.c_str(), 0) == 0; };
        if (std::none_of(tests.begin(), tests.end(), fits)) return pattern + " fits no test";
    }
    return {};
}

std::string faultOfScript(const Command& command) {
    const std::string& script = command.words[0];
    if (!isThere(script)) return script + " is not there";
    std::error_code error;
    if (fs::is_directory(fs::path(LC_SOURCE_DIR) / script, error)) return {};
    const auto mode = fs::status(fs::path(LC_SOURCE_DIR) / script, error).permissions();
    if (!script.ends_with(".py") && !script.ends_with(".cpp") && (mode & fs::perms::owner_exec) == fs::perms::none &&
        command.words.size() > 1)
        return script + " can't be run";
    return faultOfOptions(command,
                          fileText(script) + (script.starts_with("bench/") ? textBelow("bench", {".py"}) : ""));
}

std::string faultOfProgram(const Command& command) {
    const std::string target = fs::path(command.words[0]).filename().string();
    if (target.ends_with(".md") || target.ends_with(".json") || target.ends_with(".txt")) return {};
    if (target.find_first_of("ABCDEFGHIJKLMNOPQRSTUVWXYZ") != std::string::npos)
        return {};  // one of several: fuzz_TARGET
    const std::string folder = folderOfTarget(target);
    if (folder.empty()) {
        // Folders of extensions and generated programs are named by what makes them.
        return textBelow("", {"CMakeLists.txt"}).find(target) == std::string::npos
                   ? command.words[0] + " is built by nothing"
                   : "";
    }
    if (const std::string fault = faultOfFilter(command); !fault.empty()) return fault;
    return faultOfOptions(command, textBelow(folder, {".cpp", ".h"}));
}

std::string faultOfBuild(const Command& command) {
    const auto& words = command.words;
    static const std::string presets = fileText("CMakePresets.json");
    bool isTarget = false;
    for (std::size_t i = 1; i < words.size(); ++i) {
        if (words[i] == "--preset" && i + 1 < words.size() &&
            presets.find("\"" + words[i + 1] + "\"") == std::string::npos)
            return "there is no preset " + words[i + 1];
        const std::string option = words[i].substr(0, words[i].find('='));
        if (option.starts_with("-D") &&
            textBelow("", {"CMakeLists.txt", ".cmake"}).find(option.substr(2)) == std::string::npos)
            return "the build has no option " + option;
        if (words[i - 1] == "-C" || words[i - 1] == "--preset" || words[i - 1] == "--build" || words[i - 1] == "-j")
            continue;
        if (words[i].starts_with("-"))
            isTarget = words[i] == "--target";
        else if ((isTarget || words[0] == "ninja") && folderOfTarget(words[i]).empty())
            return "there is no target " + words[i];
    }
    return {};
}

enum class Shown { Sentence, Lines, Shell };  // a block that isn't marked as a shell's may be a drawing

std::vector<Command> commandsIn(const std::string& text, const Page& page, int at, Shown shown) {
    std::vector<Command> commands;
    std::string line = withoutExplanation(text);
    if (line.starts_with("$ ")) line.erase(0, 2);
    for (const std::string& choice : choicesOf(line))
        for (const std::string& part : partsOf(choice)) {
            std::vector<std::string> words = stripped(wordsOf(part));
            if (words.empty() || words[0].starts_with('#')) continue;
            const bool isCommand = shown == Shown::Shell || isOfTheTree(words[0]) ||
                                   (shown == Shown::Lines && kOfTheSystem.contains(words[0]));
            if (isCommand)
                commands.push_back({std::move(words), line, page.path, docs::at(page, at), shown == Shown::Sentence});
        }
    return commands;
}

/// Whether the packages' checks take this line out of this page and run it: `ann_runs PAGE 'how it begins'`.
bool isRunAsShown(const Command& command) {
    static const std::string checks = textBelow("tests/packages", {".sh"});
    static const std::regex kRuns("(?:ann_runs|root_runs|here_runs) ([\\w./-]+) '([^']+)'");
    for (auto run = std::sregex_iterator(checks.begin(), checks.end(), kRuns); run != std::sregex_iterator(); ++run)
        if ((*run)[1] == command.page && command.line.starts_with((*run)[2].str())) return true;
    return false;
}

/// Presets, targets and options are those of the tree; what else these programs do has to be run.
bool isBuildOfTheTree(const Command& command) {
    const auto& words = command.words;
    if (words[0] != "cmake" || words.size() < 3) return words[0] == "ninja";
    return words[1] == "--preset" || (words[1] == "--build" && words[2].starts_with("build/")) ||
           (words[1] == "-S" && words[2] == ".");
}

}  // namespace

std::vector<Command> commandsOf(const Page& page) {
    std::vector<Command> all;
    const auto add = [&](std::vector<Command> more) { std::move(more.begin(), more.end(), std::back_inserter(all)); };
    for (const CodeBlock& block : page.blocks) {
        if (!block.language.empty() && block.language != "sh") continue;
        std::string line;
        for (std::size_t i = 0; i < block.lines.size(); ++i) {
            line += block.lines[i];
            if (line.ends_with('\\')) {
                line.back() = ' ';
                while (line.ends_with("  ")) line.pop_back();
                continue;
            }
            // The rest of a line that was gone on with is indented, and no explanation.
            add(commandsIn(line, page, block.line + static_cast<int>(i),
                           block.language == "sh" ? Shown::Shell : Shown::Lines));
            line.clear();
        }
    }
    for (const Span& span : page.spans)
        if (span.text.find(' ') != std::string::npos) add(commandsIn(span.text, page, span.line, Shown::Sentence));
    return all;
}

std::string faultOf(const Command& command) {
    const std::string& program = command.words[0];
    if (program.starts_with("scripts/") || program.starts_with("bench/") || program.starts_with(".ci/"))
        return faultOfScript(command);
    if (program.starts_with("build/")) return faultOfProgram(command);
    if (isBuildOfTheTree(command)) return faultOfBuild(command);
    if (program == "lumacastctl") return {};
    if (kOfTheSystem.contains(program) || program.starts_with('/') || program.starts_with('$'))
        return isRunAsShown(command) ? "" : "no check of the packages runs: " + command.line;
    if (isOfTheTree(program)) return faultOfProgram(command);
    return program + " is no program that is known";
}

}  // namespace lumacast::docs
