#include "examples/self_recorder/CommandReader.h"

#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>

namespace lumacast::example {
namespace {
constexpr std::size_t kLongestLine = 4096;
}

void printLine(const std::string& line) {
    std::fprintf(stdout, "%s\n", line.c_str());
    std::fflush(stdout);
}

CommandReader::CommandReader(Loop& loop, const CommandTable& commands, int descriptor)
    : loop_(loop), commands_(commands), descriptor_(descriptor) {
    loop_.watch(descriptor_, [this] { readable(); });
}

CommandReader::~CommandReader() {
    loop_.unwatch(descriptor_);
}

void CommandReader::readable() {
    std::array<char, 1024> bytes{};
    const ssize_t count = ::read(descriptor_, bytes.data(), bytes.size());
    if (count < 0 && (errno == EINTR || errno == EAGAIN)) return;
    if (count <= 0) {
        loop_.unwatch(descriptor_);
        return loop_.quit(0);
    }
    pending_.append(bytes.data(), static_cast<std::size_t>(count));
    for (std::size_t end; (end = pending_.find('\n')) != std::string::npos;) {
        const std::string line = pending_.substr(0, end);
        pending_.erase(0, end + 1);
        commands_.run(line, printLine);
    }
    if (pending_.size() > kLongestLine) {
        std::fprintf(stderr, "self_recorder: a command is too long\n");
        loop_.quit(2);
    }
}

}  // namespace lumacast::example
