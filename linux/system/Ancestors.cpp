#include "linux/system/Ancestors.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <charconv>
#include <string>
#include <string_view>

#include "linux/ipc/Fd.h"

namespace lumacast {

namespace {

constexpr int kMostAncestors = 64;

}  // namespace

// The fourth field of /proc/<pid>/stat; the second one is a name in parentheses that may contain anything.
ProcessID parentOf(ProcessID pid) {
    const Fd file(::open(("/proc/" + std::to_string(number(pid)) + "/stat").c_str(), O_RDONLY | O_CLOEXEC));
    std::array<char, 512> buffer;
    const ssize_t length = file ? ::read(file.get(), buffer.data(), buffer.size()) : -1;
    if (length <= 0) return ProcessID{0};
    const std::string_view text(buffer.data(), static_cast<std::size_t>(length));
    const std::size_t name = text.rfind(')');
    if (name == std::string_view::npos || name + 4 >= text.size()) return ProcessID{0};
    std::int32_t parent = 0;
    std::from_chars(text.data() + name + 4, text.data() + text.size(), parent);
    return ProcessID{parent};
}

bool descendsFrom(ProcessID pid, ProcessID ancestor) {
    for (int step = 0; step < kMostAncestors && number(pid) > 0; ++step) {
        pid = parentOf(pid);
        if (pid == ancestor) return true;
    }
    return false;
}

}  // namespace lumacast
