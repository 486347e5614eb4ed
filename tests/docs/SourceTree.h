#pragma once
// The source tree, as the checks of the documentation look at it. Everything is read once.

#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace lumacast::docs {

/// Every file, by its path below the top of the tree, sorted. Without build folders and what version control keeps.
const std::vector<std::string>& treeFiles();

/// Whether a file or a folder is there, by its path below the top.
bool isThere(std::string_view path);

/// Empty when it is not there.
std::string fileText(std::string_view path);

/// The text of all files below a folder that end in one of `endings`, one behind the other.
std::string textBelow(std::string_view folder, const std::vector<std::string>& endings);

/// Every name in the code below `src`, `linux`, `client`, `extensions`, `examples` and `tests`, comments and texts left
/// out.
bool isNameInCode(std::string_view name);
/// Whether a name stands in a file, or in any source file below a folder.
bool isNameIn(std::string_view path, std::string_view name);

/// "Suite.Name" of every test, and of those with parameters "Prefix/Suite.Name/0" too.
const std::set<std::string>& testNames();

/// The folder whose CMakeLists.txt makes a target of this name; empty when none does.
std::string folderOfTarget(const std::string& target);

}  // namespace lumacast::docs
