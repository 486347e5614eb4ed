#pragma once
// Sounds by their names: the Sound Theme Specification 0.8 and the Sound Naming Specification 0.1 of freedesktop.org.

#include <string>
#include <vector>

namespace lumacast::sound {

/// Where the user's sounds lie. A value. Every question reads the disk and blocks as long as that does.
struct SoundThemes {
    std::vector<std::string> dataDirectories;    ///< most important first; the themes are in their folders "sounds"
    std::vector<std::string> configDirectories;  ///< most important first; say which theme is wanted

    /// The theme that the desktop's settings name: `Theme` in [Sounds] of kdeglobals, else `gtk-sound-theme-name` in
    /// [Settings] of gtk-4.0/settings.ini or gtk-3.0/settings.ini. "freedesktop" where none does.
    std::string currentTheme() const;

    /// The files for the first of `names` that the current theme, those it inherits from, "freedesktop" or the sounds
    /// outside themes have, then those for the next name; best first, at most 16. Names of a theme or a sound that
    /// would lead out of their folder find nothing. Sounds are not looked for by language: none that is asked for
    /// speaks. A theme's mark that it has no such sound (".disabled") does not count, deliberately: these are played
    /// because a rule or the user wants them to be heard.
    std::vector<std::string> files(const std::vector<std::string>& names) const;

private:
    struct Theme;
    Theme read(const std::string& name) const;
    std::vector<Theme> chain() const;
};

}  // namespace lumacast::sound
