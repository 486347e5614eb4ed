#pragma once
#include <string>
#include <utility>
#include <vector>

namespace lumacast::probe {

/// What came of each attempt: its name, and "0" when it was let through, else the error's name.
using Outcomes = std::vector<std::pair<std::string, std::string>>;

/// Everything that no extension may do, whatever it was granted. `victim` is a process of the same user outside.
Outcomes attackEverything(int victim);

/// "read", "write" or the error's name: what can be done with the file or folder; "empty" of a folder that has nothing
/// to read.
std::string openedAs(const std::string& path);

/// Tries to write through a descriptor that was given to be read, and to open it anew with more rights. The names of
/// what went through; empty when nothing did.
std::string writtenThrough(int descriptor);

}  // namespace lumacast::probe
