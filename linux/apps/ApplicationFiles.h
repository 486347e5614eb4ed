#pragma once
// The files that describe applications, as they lie on the disk. Everything here blocks as long as the disk does.

#include <optional>
#include <string>
#include <vector>

#include "linux/apps/DesktopEntry.h"
#include "linux/apps/Manifest.h"
#include "linux/system/SmallFile.h"

namespace lumacast {

/// The desktop entry at `path`, of at most 256 KiB. None when there is none, or everybody may write to it.
std::optional<DesktopEntry> readDesktopEntry(const std::string& path);

/// The file `manifest.json` in `folder`, of at most 256 KiB. None when there is none, when everybody may write to it,
/// or when it belongs neither to this user nor to the administrator.
std::optional<Manifest> readManifest(const std::string& folder);

inline constexpr std::string_view kManifestName = "manifest.json";

/// The names in a directory, sorted, without those that start with a dot; none when it can't be read. At most
/// `maximum`.
std::optional<std::vector<std::string>> namesIn(const std::string& directory, std::size_t maximum);

/// The nearest folder with a manifest that names an application: that of `executable`, or one of the three above it.
std::optional<std::string> applicationFolder(const std::string& executable);

/// Where a command is found: an absolute path as it stands, a bare name in `searchPath`; with all links resolved. None
/// when it is not there.
std::optional<std::string> resolvedProgram(const std::string& command, const std::vector<std::string>& searchPath);

}  // namespace lumacast
