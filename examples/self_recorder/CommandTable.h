#pragma once

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace lumacast::example {

/// The words that followed a command's name.
using Arguments = std::vector<std::string>;

/// Answers a command with one line. Called exactly once, at once or later, on the loop.
using Reply = std::function<void(const std::string& line)>;

/// The commands an application understands, by name. Each part of the application adds its own with `add`, so the loop
/// that reads the lines knows none of them. Lives on the loop.
class CommandTable final {
public:
    using Handler = std::function<void(const Arguments&, const Reply&)>;

    /// `usage` is the command as typed, its name first ("size W H"); the number of arguments must be the number of
    /// words after the name.
    void add(const std::string& usage, const std::string& help, Handler handler);

    /// Runs one line. An unknown name or a wrong number of arguments is answered with "error ..." and calls no handler.
    /// An empty line is ignored.
    void run(const std::string& line, const Reply& reply) const;

    /// One line per command.
    [[nodiscard]] std::string help() const;

private:
    struct Command {
        std::string usage;
        std::string help;
        std::size_t arguments;
        Handler handler;
    };
    std::map<std::string, Command> commands_;
};

/// A whole decimal number, none when the word is anything else.
[[nodiscard]] std::optional<int> wholeNumber(const std::string& word);

}  // namespace lumacast::example
