#include "linux/apps/DesktopEntry.h"

#include <algorithm>
#include <array>

#include "base/Utf8.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumTranslations = 512;
constexpr std::size_t kMaximumArguments = 256;

std::string_view trimmed(std::string_view text) {
    const std::size_t first = text.find_first_not_of(" \t\r");
    if (first == std::string_view::npos) return {};
    return text.substr(first, text.find_last_not_of(" \t\r") - first + 1);
}

/// The escapes of string values: \s \n \t \r \\ (section "Possible value types").
std::string unescaped(std::string_view text) {
    std::string result;
    for (std::size_t at = 0; at < text.size(); ++at) {
        if (text[at] != '\\' || at + 1 == text.size()) {
            result += text[at];
            continue;
        }
        switch (const char c = text[++at]) {
            case 's': result += ' '; break;
            case 'n': result += '\n'; break;
            case 't': result += '\t'; break;
            case 'r': result += '\r'; break;
            case '\\': result += '\\'; break;
            default: result += '\\'; result += c;
        }
    }
    return result;
}

/// The arguments of an Exec value (section "The Exec key"): separated by blanks, quoted in whole by double quotes,
/// where a backslash protects what follows; "%%" is a percent sign. None when a quote is not closed.
std::optional<std::vector<std::string>> arguments(std::string_view exec) {
    std::vector<std::string> result;
    bool inArgument = false;
    bool quoted = false;
    for (std::size_t at = 0; at < exec.size(); ++at) {
        const char c = exec[at];
        if (!quoted && (c == ' ' || c == '\t')) {
            inArgument = false;
            continue;
        }
        if (!inArgument) {
            if (result.size() == kMaximumArguments) break;
            result.emplace_back();
            inArgument = true;
        }
        if (c == '"')
            quoted = !quoted;
        else if (quoted && c == '\\' && at + 1 < exec.size())
            result.back() += exec[++at];
        else if (c == '%' && exec.substr(at).starts_with("%%"))
            result.back() += exec[++at];
        else
            result.back() += c;
    }
    return quoted ? std::nullopt : std::optional(std::move(result));
}

void setEntry(DesktopEntry& entry, std::string_view key, std::string_view value) {
    if (key == "Type") entry.isApplication = value == "Application";
    if (key == "Hidden") entry.hidden = value == "true";
    if (key == "Name") entry.name = unescaped(value);
    if (key == "Icon") entry.icon = unescaped(value);
    if (key == "Exec") entry.exec = unescaped(value);
    if (key == "TryExec") entry.tryExec = unescaped(value);
    if (key == "X-Lumacast-Executable") entry.lumacastExecutable = unescaped(value);
    if (key.starts_with("Name[") && key.ends_with(']') && entry.localizedNames.size() < kMaximumTranslations)
        entry.localizedNames.emplace_back(key.substr(5, key.size() - 6), unescaped(value));
}

}  // namespace

bool isInterpreter(std::string_view program) {
    // Shells and languages, containers, terminals, other users, and what starts another program in its place.
    static constexpr auto kNames = std::to_array<std::string_view>({
        "sh", "bash", "dash", "zsh", "ksh", "fish", "busybox", "node", "nodejs", "deno", "bun", "java", "mono",
        "dotnet", "gjs", "awk", "gawk", "mawk", "Rscript", "expect", "flatpak", "snap", "bwrap", "firejail", "chroot",
        "unshare", "nsenter", "xterm", "gnome-terminal", "konsole", "x-terminal-emulator", "tmux", "screen", "script",
        "pkexec", "sudo", "su", "doas", "runuser", "setpriv", "systemd-run", "env", "nice", "ionice", "nohup",
        "setsid", "stdbuf", "timeout", "taskset", "chrt", "xargs", "dbus-launch", "dbus-run-session", "gdb", "strace",
        "ltrace", "valgrind", "ld.so"});
    static constexpr std::array<std::string_view, 10> kFamilies{"python", "perl",     "ruby",  "php",   "lua",
                                                                "wine",   "electron", "guile", "tclsh", "wish"};
    const std::string_view name = program.substr(program.rfind('/') + 1);
    return std::find(kNames.begin(), kNames.end(), name) != kNames.end() ||
           (name.starts_with("ld-") && name.find(".so") != std::string_view::npos) ||  // the loader of all programs
           std::any_of(kFamilies.begin(), kFamilies.end(), [&](std::string_view family) {
               return name.starts_with(family) &&
                      name.find_first_not_of("0123456789.-", family.size()) == std::string_view::npos;
           });
}

std::optional<DesktopEntry> DesktopEntry::parse(std::string_view text) {
    if (!isValidUtf8(text)) return std::nullopt;
    std::optional<DesktopEntry> entry;
    bool inGroup = false;
    while (!text.empty()) {
        const std::size_t newline = text.find('\n');
        const std::string_view line = trimmed(text.substr(0, newline));
        text.remove_prefix(newline == std::string_view::npos ? text.size() : newline + 1);
        if (line.empty() || line.front() == '#') continue;
        if (line.front() == '[') {
            if (entry) break;  // the group is read; actions and other groups are not for us
            inGroup = line == "[Desktop Entry]";
            if (inGroup) entry.emplace();
            continue;
        }
        const std::size_t equals = line.find('=');
        if (inGroup && equals != std::string_view::npos)
            setEntry(*entry, trimmed(line.substr(0, equals)), trimmed(line.substr(equals + 1)));
    }
    return entry;
}

std::optional<std::string> DesktopEntry::localizedName(const std::vector<Locale>& locales) const {
    const auto find = [&](const std::string& locale) -> const std::string* {
        for (const auto& [written, translation] : localizedNames)
            if (written == locale) return &translation;
        return nullptr;
    };
    for (const Locale& locale : locales) {
        const std::string country = locale.country.empty() ? "" : "_" + locale.country;
        const std::string modifier = locale.modifier.empty() ? "" : "@" + locale.modifier;
        // The order of the section "Localized values for keys".
        for (const std::string& written : {locale.language + country + modifier, locale.language + country,
                                           locale.language + modifier, locale.language})
            if (const std::string* found = find(written)) return *found;
        if (locale.language == "en") return std::nullopt;
    }
    return std::nullopt;
}

std::optional<std::string> DesktopEntry::program() const {
    const auto words = arguments(exec);
    if (!words) return std::nullopt;
    auto word = words->begin();
    if (word != words->end() && (*word == "env" || *word == "/usr/bin/env")) {
        ++word;
        while (word != words->end() && word->find('=') != std::string::npos) ++word;
        if (word != words->end() && word->starts_with('-')) return std::nullopt;  // an option of env: too clever for us
    }
    if (word == words->end() || word->empty() || isInterpreter(*word)) return std::nullopt;
    return *word;
}

}  // namespace lumacast
