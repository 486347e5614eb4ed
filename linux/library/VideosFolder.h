#pragma once
#include <optional>
#include <string>
#include <string_view>

namespace lumacast {

/// The value of a folder in the text of a user-dirs.dirs file (freedesktop.org, xdg-user-dirs: user-dirs.dirs(5)):
/// NAME="$HOME/path" or NAME="/path", with backslashes before what the shell would take. The last line of a name
/// counts, as the shell reads it; none for a name that is not there or whose value is of neither form. Without a slash
/// at its end.
std::optional<std::string> userDirectory(std::string_view text, std::string_view name, const std::string& home);

/// The user's Videos folder: of `configHome`/user-dirs.dirs, else `environment` (the variable XDG_VIDEOS_DIR) where that
/// is an absolute path, else `home`/Videos. Reads the file with the calling thread's rights; blocks as long as the disk
/// does.
std::string videosFolder(const std::string& home, const std::string& configHome, const std::string& environment);

}  // namespace lumacast
