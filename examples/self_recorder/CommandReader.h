#pragma once

#include <string>

#include "examples/self_recorder/CommandTable.h"
#include "examples/self_recorder/Loop.h"

namespace lumacast::example {

/// Reads commands from a descriptor, one per line, runs them and prints the replies on standard output, each flushed.
/// The end of the input ends the loop with status 0, so that an application never outlives the script that drives it. A
/// line longer than 4096 bytes ends it with status 2.
class CommandReader final {
public:
    /// Borrows all three.
    CommandReader(Loop& loop, const CommandTable& commands, int descriptor);
    ~CommandReader();
    CommandReader(const CommandReader&) = delete;
    CommandReader& operator=(const CommandReader&) = delete;

private:
    void readable();

    Loop& loop_;
    const CommandTable& commands_;
    int descriptor_;
    std::string pending_;
};

/// Prints one line on standard output and flushes it.
void printLine(const std::string& line);

}  // namespace lumacast::example
