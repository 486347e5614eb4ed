#pragma once
// Icons by their names: the Icon Theme Specification 0.13 of freedesktop.org.

#include <optional>
#include <string>
#include <vector>

#include "base/Value.h"

namespace lumacast {

/// Where the user's icons lie. A value. Every question reads the disk and blocks as long as that does.
struct IconThemes {
    std::string home;                            ///< ".icons" is in it
    std::vector<std::string> dataDirectories;    ///< most important first; themes in "icons", others in "pixmaps"
    std::vector<std::string> configDirectories;  ///< most important first; say which theme is wanted

    /// The theme that the desktop's settings name: `Theme` in [Icons] of kdeglobals, else `gtk-icon-theme-name` in
    /// [Settings] of gtk-4.0/settings.ini or gtk-3.0/settings.ini. "hicolor" where none does.
    std::string currentTheme() const;

    /// The icon as a PNG file: of the current theme in the size (pixels of a side) or the one nearest to it, else of
    /// those it inherits from, of "hicolor", or outside themes. `icon` is a name, with or without ".png", or an
    /// absolute path. None for a name that would lead out of its folder, and for files that are not PNG, larger than 1
    /// MiB, or that belong to somebody other than this user and the administrator or may be written by everybody.
    std::optional<Data> png(const std::string& icon, int size) const;

    /// The file at an absolute path, under the same conditions.
    static std::optional<Data> pngAt(const std::string& path);

private:
    struct Folder;
    struct Theme;
    std::vector<std::string> places() const;
    Theme read(const std::string& name) const;
    std::vector<Theme> chain() const;
};

}  // namespace lumacast
