#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>

#include "extensions/hls-clips/Destination.h"
#include "linux/ipc/Fd.h"

namespace lumacast::extensions {

namespace {

class Folder final : public Destination {
public:
    explicit Folder(std::string path) : path_(std::move(path)) {}

    std::string put(const std::string& name, const Data& contents, std::string_view) override {
        std::error_code ignored;  // what is missing shows when the file is made
        std::filesystem::create_directories(path_, ignored);
        const std::string target = path_ + "/" + name, temporary = path_ + "/." + name + ".new";
        std::string error = write(temporary, contents);
        if (error.empty() && std::rename(temporary.c_str(), target.c_str()) != 0) error = std::strerror(errno);
        if (!error.empty()) ::unlink(temporary.c_str());
        return error;
    }
    void remove(const std::string& name) override { ::unlink((path_ + "/" + name).c_str()); }

private:
    static std::string write(const std::string& path, const Data& contents) {
        // Whoever serves the folder is another user, mostly.
        const Fd file(::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, 0644));
        if (!file) return std::strerror(errno);
        for (std::size_t at = 0; at < contents.size();) {
            const auto done = ::write(file.get(), contents.data() + at, contents.size() - at);
            if (done < 0 && errno == EINTR) continue;
            if (done <= 0) return std::strerror(errno);
            at += static_cast<std::size_t>(done);
        }
        return {};
    }

    const std::string path_;
};

}  // namespace

std::unique_ptr<Destination> makeFolder(std::string path) {
    return std::make_unique<Folder>(std::move(path));
}

}  // namespace lumacast::extensions
