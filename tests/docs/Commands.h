#pragma once
// The commands that the pages show.

#include <string>
#include <vector>

#include "tests/docs/Markdown.h"

namespace lumacast::docs {

struct Command {
    std::vector<std::string> words;
    std::string line;  ///< all of the line that it is a part of, without what explains it
    std::string page;
    std::string where;
    bool isProse = false;  ///< named in a sentence, where arguments may be left out
};

/// The commands of a shell block's lines, and those that a sentence names, with what brackets leave to choose written
/// out.
std::vector<Command> commandsOf(const Page& page);

/// What is wrong with a command that names a script or a program of the tree, or in a block marked `sh` any; empty for
/// a good one. Of the system's programs a page shows only what a test runs as it stands. What `lumacastctl` would say to its own line is asked of it, see `wrongUsageOf`.
std::string faultOf(const Command& command);

}  // namespace lumacast::docs
