#include "linux/media/MovieFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "linux/storage/BeneathDirectory.h"

namespace lumacast::media {

namespace {

class PosixMovieFile final : public MovieFile {
public:
    explicit PosixMovieFile(int descriptor) : descriptor_(descriptor) {}
    PosixMovieFile(const PosixMovieFile&) = delete;
    PosixMovieFile& operator=(const PosixMovieFile&) = delete;
    ~PosixMovieFile() override { ::close(descriptor_); }

    int write(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
        while (!bytes.empty()) {
            const ssize_t count = ::pwrite(descriptor_, bytes.data(), bytes.size(), static_cast<off_t>(offset));
            if (count < 0 && errno == EINTR) continue;
            if (count < 0) return errno;
            if (count == 0) return EIO;
            offset += static_cast<std::uint64_t>(count);
            bytes = bytes.subspan(static_cast<std::size_t>(count));
        }
        return 0;
    }

    int sync() override {
        while (::fdatasync(descriptor_) != 0) {
            if (errno == EINTR) continue;
            return errno == EINVAL || errno == EROFS ? 0 : errno;  // not a file that can be synced
        }
        return 0;
    }

    void removeName(const std::string& path) override {
        struct stat own {}, named {};
        if (::fstat(descriptor_, &own) != 0 || ::lstat(path.c_str(), &named) != 0) return;
        if (own.st_dev == named.st_dev && own.st_ino == named.st_ino) ::unlink(path.c_str());
    }

private:
    const int descriptor_;
};

/// `folder` may be AT_FDCWD.
std::variant<std::unique_ptr<MovieFile>, int> createIn(int folder, const std::string& name) {
    for (;;) {
        // The mode is what umask 077 would leave, whatever the process's umask is.
        const int descriptor = ::openat(folder, name.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
        if (descriptor >= 0) return std::make_unique<PosixMovieFile>(descriptor);
        if (errno != EINTR) return errno;
    }
}

bool climbs(const std::string& path) { return ("/" + path + "/").find("/../") != std::string::npos; }

}  // namespace

std::variant<std::unique_ptr<MovieFile>, int> PosixMovieFiles::create(const std::string& path) {
    if (path.empty() || climbs(path)) return EINVAL;
    if (!directory_) return createIn(AT_FDCWD, path);
    const std::string inside = withSingleSlashes(*directory_) + "/";
    const std::string whole = withSingleSlashes(path);
    if (!whole.starts_with(inside) || whole.find('/', inside.size()) != std::string::npos) return EACCES;
    const auto folder = openTrusted(inside);
    if (const int* error = std::get_if<int>(&folder)) return *error;
    return createIn(std::get<FileDescriptor>(folder).get(), whole.substr(inside.size()));
}

}  // namespace lumacast::media
