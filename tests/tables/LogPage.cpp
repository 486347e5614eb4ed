#include <algorithm>
#include <cctype>
#include <map>
#include <set>

#include "tests/tables/Tables.h"
#include "tests/unit/architecture/SourceText.h"

namespace lumacast::tables {

namespace {

struct Call {
    std::string_view name, heading, meaning;
};
/// In the order of the page.
constexpr Call kCalls[] = {
    {"error", "Errors", "Something went wrong; on standard error and in the journal with priority 3."},
    {"line", "Ordinary lines", "What the system does."},
    {"debug", "Debug", "Only where they are asked for (`Log::setVerbose`)."},
    {"sample", "Samples", "Once per frame or buffer of sound; the same."},
    {"print", "Standard output", "No log lines: they are printed."},
};

bool isNamePart(char c) {
    return std::isalnum(static_cast<unsigned char>(c)) != 0 || c == '_';
}

/// Whether the name that ends at `end` is a log's: log, log_, Log ... as a member or alone.
bool isLog(const std::string& code, std::size_t end) {
    std::size_t begin = end;
    while (begin > 0 && isNamePart(code[begin - 1])) --begin;
    const std::string name = code.substr(begin, end - begin);
    return name == "log" || name == "log_";
}

/// The texts that a call of this name logs, joined as the compiler joins them.
std::set<std::string> formatsIn(const architecture::SourceFile& file, const std::string& code, std::string_view name) {
    std::set<std::string> formats;
    const std::string wanted = "." + std::string(name) + "(";
    for (auto at = code.find(wanted); at != std::string::npos; at = code.find(wanted, at + 1)) {
        if (!isLog(code, at)) continue;
        std::string format;
        std::size_t from = at + wanted.size();
        for (;;) {
            while (from < code.size() && std::isspace(static_cast<unsigned char>(code[from]))) ++from;
            if (from >= code.size() || code[from] != '"') break;
            std::size_t end = from + 1;
            while (end < file.text.size() && file.text[end] != '"') end += file.text[end] == '\\' ? 2 : 1;
            format += file.text.substr(from + 1, end - from - 1);
            from = end + 1;
        }
        if (!format.empty()) formats.insert(format);
    }
    return formats;
}

}  // namespace

std::string logPage() {
    std::map<std::string_view, std::map<std::string, std::set<std::string>>> lines;  // by call, text: files
    for (const char* folder : {"src", "linux"})
        for (const auto& file : architecture::sourcesBelow(folder)) {
            const std::string code = architecture::codeOf(file.text);
            for (const Call& call : kCalls)
                for (const std::string& format : formatsIn(file, code, call.name))
                    lines[call.name][format].insert(file.path);
        }
    std::string text =
        "# The lines of the log\n\n"
        "Every line that the daemon can log, by its level and text, with where in the code it stands. Printed by "
        "`scripts/tables`\n"
        "from the calls in `src/` and `linux/`. Conversions stand for what is put in: `%d`, `%i` and `%u` numbers, "
        "`%f` a fraction, `%s` and `%@`\n"
        "text. Which of them to watch: [on a device](../on-a-device.md#lines-to-watch).\n";
    for (const Call& call : kCalls) {
        text +=
            "\n## " + std::string(call.heading) + "\n\n" + std::string(call.meaning) + "\n\n" + head({"line", "where"});
        for (const auto& [format, files] : lines[call.name]) {
            std::string where;
            for (const std::string& file : files) where += (where.empty() ? "" : ", ") + code(file);
            text += row({code(format), where});
        }
    }
    return text;
}

}  // namespace lumacast::tables
