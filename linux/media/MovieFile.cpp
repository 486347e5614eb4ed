#include "linux/media/MovieFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "linux/calls/FileCalls.h"
#include "linux/calls/FolderSync.h"
#include "linux/storage/BeneathDirectory.h"
#include "linux/system/FileLock.h"

namespace lumacast::media {

namespace {

class PosixMovieFile final : public MovieFile {
public:
    /// `folder` holds the file.
    PosixMovieFile(int descriptor, Fd folder) : descriptor_(descriptor), folder_(std::move(folder)) {}
    PosixMovieFile(const PosixMovieFile&) = delete;
    PosixMovieFile& operator=(const PosixMovieFile&) = delete;
    ~PosixMovieFile() override { ::close(descriptor_); }

    int write(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
        while (!bytes.empty()) {
            const ssize_t count = calls::writeAt(descriptor_, bytes.data(), bytes.size(), static_cast<off_t>(offset));
            if (count < 0) return errno;
            if (count == 0) return EIO;
            offset += static_cast<std::uint64_t>(count);
            bytes = bytes.subspan(static_cast<std::size_t>(count));
        }
        return 0;
    }

    int sync() override {
        if (calls::syncData(descriptor_) != 0)
            return errno == EINVAL || errno == EROFS ? 0 : errno;  // not a file that can be synced
        if (!folder_) return 0;
        // Once: a file whose name is not on the disk is gone after a power cut, however much of it is there.
        const Fd folder = std::move(folder_);
        return syncFolder(folder.get());
    }

    void removeName(const std::string& path) override {
        struct stat own {}, named {};
        if (::fstat(descriptor_, &own) != 0 || ::lstat(path.c_str(), &named) != 0) return;
        if (own.st_dev == named.st_dev && own.st_ino == named.st_ino) calls::unlinkAt(AT_FDCWD, path);
    }

private:
    const int descriptor_;
    Fd folder_;  ///< until its names have been synced
};

std::variant<std::unique_ptr<MovieFile>, int> createIn(Fd folder, const std::string& name) {
    // The mode is what umask 077 would leave, whatever the process's umask is.
    const int descriptor = calls::openAt(folder.get(), name, O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
    if (descriptor < 0) return errno;
    (void)markBeingWritten(descriptor);  // it is new: nobody else's
    return std::make_unique<PosixMovieFile>(descriptor, std::move(folder));
}

bool climbs(const std::string& path) { return ("/" + path + "/").find("/../") != std::string::npos; }

}  // namespace

std::variant<std::unique_ptr<MovieFile>, int> PosixMovieFiles::create(const std::string& path) {
    if (path.empty() || climbs(path)) return EINVAL;
    if (!directory_) {
        const std::size_t slash = path.rfind('/');
        const std::string around = slash == std::string::npos ? "." : path.substr(0, slash + 1);
        Fd folder(calls::openAt(AT_FDCWD, around, O_PATH | O_DIRECTORY | O_CLOEXEC));
        if (!folder) return errno;
        return createIn(std::move(folder), path.substr(slash + 1));  // from 0 on where there is none
    }
    const std::string inside = withSingleSlashes(*directory_) + "/";
    const std::string whole = withSingleSlashes(path);
    if (!whole.starts_with(inside) || whole.find('/', inside.size()) != std::string::npos) return EACCES;
    auto folder = openTrusted(inside);
    if (const int* error = std::get_if<int>(&folder)) return *error;
    return createIn(std::move(std::get<Fd>(folder)), whole.substr(inside.size()));
}

}  // namespace lumacast::media
