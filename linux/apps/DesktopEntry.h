#pragma once
// Desktop entries: the files that describe installed applications (Desktop Entry Specification 1.5).

#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "linux/apps/Languages.h"

namespace lumacast {

/// Whether a program (its path, or its name) runs whatever it is given: a process that runs it is nobody's application.
bool isInterpreter(std::string_view program);

/// What this system needs of a desktop entry. A value.
struct DesktopEntry {
    bool isApplication = false;  ///< Type=Application
    bool hidden = false;         ///< counts as if it had been deleted
    std::string name;
    std::vector<std::pair<std::string, std::string>> localizedNames;  ///< locale as written ("pt_BR"), name
    std::string icon;  ///< a name of the icon theme, or an absolute path
    std::string exec;
    std::string tryExec;
    std::string
        lumacastExecutable;  ///< X-Lumacast-Executable: the application's own program, where Exec starts another

    /// A pure parser of the whole file. None when there is no [Desktop Entry] group, or the text is not UTF-8.
    static std::optional<DesktopEntry> parse(std::string_view text);

    /// The name in the first of `locales` it is translated to. None when the plain name is the best one: it counts as
    /// English, so a user of English never gets a translation for a later language.
    std::optional<std::string> localizedName(const std::vector<Locale>& locales) const;

    /// The program that Exec starts: its first argument unquoted, `env` and variables before it passed over. None when
    /// there is none, or when it is an interpreter or a launcher, whose process says nothing about the application.
    std::optional<std::string> program() const;
};

}  // namespace lumacast
