#pragma once
#include <string>
#include <vector>

namespace lumacast::launcher {

/// What files the calling thread, and whatever it becomes, may open.
struct FileRules {
    std::vector<std::string> readable;  ///< folders with all below them, and files: read and run
    std::vector<std::string> writable;  ///< the same: read, run, write, make and remove
};

/// The version of the kernel's Landlock; 0 when it has none.
int landlockVersion();

/// Restricts this process to the rules, for good: what they don't name can't be opened, also not anew through a
/// descriptor of it. Paths that are not there are passed over. Signals and abstract sockets are kept within the
/// restricted processes where the kernel can do that. False with errno set when that can't be done.
[[nodiscard]] bool restrictFiles(const FileRules& rules);

}  // namespace lumacast::launcher
