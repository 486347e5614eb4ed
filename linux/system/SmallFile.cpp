#include "linux/system/SmallFile.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "linux/ipc/Fd.h"

namespace lumacast {

std::optional<SmallFile> readSmallFile(const std::string& path, std::size_t maximumBytes) {
    // O_NONBLOCK: opening a pipe that somebody put there must not wait for its writer.
    const Fd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    SmallFile result;
    if (!file || ::fstat(file.get(), &result.status) != 0 || !S_ISREG(result.status.st_mode)) return std::nullopt;
    if (result.status.st_size < 0 || static_cast<std::size_t>(result.status.st_size) > maximumBytes)
        return std::nullopt;
    // The size is only a hint: the file may grow while it is read, and some systems' files say 0.
    char buffer[4096];
    while (true) {
        const ssize_t count = ::read(file.get(), buffer, sizeof buffer);
        if (count < 0 && errno == EINTR) continue;
        if (count < 0) return std::nullopt;
        if (count == 0) return result;
        result.text.append(buffer, static_cast<std::size_t>(count));
        if (result.text.size() > maximumBytes) return std::nullopt;
    }
}

}  // namespace lumacast
