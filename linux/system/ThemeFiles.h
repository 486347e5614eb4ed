#pragma once
// What the desktop's themes of icons and of sounds have in common: the settings that choose one, and their indices.

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "linux/system/IniFile.h"

namespace lumacast {

/// In bytes; what is longer names nothing. A name is as long as a file system's may be.
inline constexpr std::size_t kMaximumThemeName = 255;
inline constexpr std::size_t kMaximumThemePath = 1024;

/// Whether it names something in a folder, and nothing outside nor hidden.
bool isPlainName(std::string_view name);

/// The same for a folder of a theme, which may have folders above it.
bool isPlainPath(std::string_view path);

/// The items of a list with commas or semicolons between them, without the blanks around them; at most `most`, and no
/// empty ones.
std::vector<std::string> listedIn(std::string_view text, std::size_t most);

/// A settings file or a theme's index; none when it can't be read or is longer than 256 KiB. Waits for the disk.
std::optional<IniFile> settingsAt(const std::string& path);

}  // namespace lumacast
