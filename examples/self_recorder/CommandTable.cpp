#include "examples/self_recorder/CommandTable.h"

#include <charconv>
#include <sstream>

namespace lumacast::example {
namespace {

Arguments wordsOf(const std::string& line) {
    std::istringstream stream(line);
    Arguments words;
    for (std::string word; stream >> word;) words.push_back(word);
    return words;
}

}  // namespace

void CommandTable::add(const std::string& usage, const std::string& help, Handler handler) {
    const Arguments words = wordsOf(usage);
    commands_[words.front()] = {usage, help, words.size() - 1, std::move(handler)};
}

void CommandTable::run(const std::string& line, const Reply& reply) const {
    Arguments words = wordsOf(line);
    if (words.empty()) return;
    const std::string name = words.front();
    words.erase(words.begin());
    const auto found = commands_.find(name);
    if (found == commands_.end()) return reply("error unknown command " + name);
    if (words.size() != found->second.arguments) return reply("error usage: " + found->second.usage);
    found->second.handler(words, reply);
}

std::string CommandTable::help() const {
    std::string text;
    for (const auto& [name, command] : commands_) {
        std::string usage = command.usage;
        usage.resize(std::max<std::size_t>(usage.size(), 14), ' ');
        text += "  " + usage + "  " + command.help + "\n";
    }
    return text;
}

std::optional<int> wholeNumber(const std::string& word) {
    int value = 0;
    const auto [end, error] = std::from_chars(word.data(), word.data() + word.size(), value);
    if (error != std::errc() || end != word.data() + word.size()) return std::nullopt;
    return value;
}

}  // namespace lumacast::example
