// Desktop entries. Up to two lines of environment (the languages and the message locale) stand before the file, each
// ended by a zero byte: `de:pt_BR\0sr_RS@latin\0[Desktop Entry]...`.

#include "linux/apps/DesktopEntry.h"

#include <algorithm>

#include "base/Utf8.h"
#include "fuzz/Input.h"
#include "fuzz/Property.h"

namespace lumacast::fuzz {

namespace {

std::string_view takeLine(std::string_view& text) {
    const std::size_t end = text.find('\0');
    if (end == std::string_view::npos) return {};
    const std::string_view line = text.substr(0, end);
    text.remove_prefix(end + 1);
    return line;
}

std::string escaped(std::string_view text) {
    std::string result;
    for (const char c : text) {
        switch (c) {
            case '\\': result += "\\\\"; break;
            case ' ': result += "\\s"; break;
            case '\n': result += "\\n"; break;
            case '\t': result += "\\t"; break;
            case '\r': result += "\\r"; break;
            default: result += c;
        }
    }
    return result;
}

std::string printed(const DesktopEntry& entry) {
    std::string result = "# printed\n[Desktop Entry]\n";
    if (entry.isApplication) result += "Type=Application\n";
    if (entry.hidden) result += "Hidden=true\n";
    result += "Name=" + escaped(entry.name) + "\n";
    for (const auto& [locale, name] : entry.localizedNames) result += "Name[" + locale + "]=" + escaped(name) + "\n";
    result += "Exec=" + escaped(entry.exec) + "\nTryExec = " + escaped(entry.tryExec) + "\r\n";
    result += "X-Lumacast-Executable=" + escaped(entry.lumacastExecutable) + "\n[Desktop Action x]\nName=another\n";
    return result;
}

bool isSame(const DesktopEntry& a, const DesktopEntry& b) {
    return a.isApplication == b.isApplication && a.hidden == b.hidden && a.name == b.name &&
           a.localizedNames == b.localizedNames && a.exec == b.exec && a.tryExec == b.tryExec &&
           a.lumacastExecutable == b.lumacastExecutable;
}

void checkEntry(const DesktopEntry& entry, std::size_t fileSize) {
    require(entry.localizedNames.size() <= 512, "an entry has at most 512 translations");
    std::size_t bytes = entry.name.size() + entry.exec.size() + entry.tryExec.size() + entry.lumacastExecutable.size();
    for (const std::string* text : {&entry.name, &entry.exec, &entry.tryExec, &entry.lumacastExecutable})
        require(isValidUtf8(*text), "values are UTF-8");
    for (const auto& [locale, name] : entry.localizedNames) {
        require(isValidUtf8(locale) && isValidUtf8(name), "translations are UTF-8");
        bytes += locale.size() + name.size();
    }
    require(bytes <= fileSize, "escapes never grow");
    if (const auto program = entry.program()) {
        require(!program->empty(), "a program has a name");
        require(program->size() <= entry.exec.size(), "a program is a part of its Exec");
        for (const char* launcher : {"sh", "bash", "python3", "env"})
            require(program->substr(program->rfind('/') + 1) != launcher, "a launcher is nobody's own program");
    }
    const auto again = DesktopEntry::parse(printed(entry));
    require(again.has_value(), "a printed entry is an entry");
    require(isSame(*again, entry), "a printed entry reads as the same entry");
}

void checkLocales(const std::vector<Locale>& locales, const std::optional<DesktopEntry>& entry) {
    require(!locales.empty() && locales.size() <= 33, "there is a language, and not too many");
    std::vector<std::string> tags, available;
    for (const Locale& locale : locales) {
        require(locale.language.size() >= 2, "a locale has a language");
        tags.push_back(languageTag(locale));
        require(tags.back().starts_with(locale.language), "a tag begins with its language");
    }
    if (!entry) return;
    for (const auto& [locale, name] : entry->localizedNames) available.push_back(locale);
    const auto matches = matchingLocalizations(tags, available);
    require(matches.size() <= available.size(), "a localization matches once");
    for (const std::string& match : matches)
        require(std::find(available.begin(), available.end(), match) != available.end(), "matches are available");
    if (const auto name = entry->localizedName(locales)) {
        require(std::any_of(entry->localizedNames.begin(), entry->localizedNames.end(),
                            [&](const auto& translation) { return translation.second == *name; }),
                "a localized name is one of the entry's");
    }
}

}  // namespace

void desktopEntry(Bytes input) {
    std::string_view text = textOf(input);
    const std::string_view languages = takeLine(text), messageLocale = takeLine(text);
    const auto entry = DesktopEntry::parse(text);
    require(!entry || isValidUtf8(text), "text that is not UTF-8 is no entry");
    if (entry) checkEntry(*entry, text.size());
    checkLocales(userLocales(languages, messageLocale), entry);
}

}  // namespace lumacast::fuzz
