#pragma once
// The files of movies that are in the temporary directory already. All calls to the file system are here.

#include <sys/stat.h>

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/ipc/Fd.h"
#include "linux/media/mp4/BoxSink.h"
#include "linux/media/mp4/BoxSource.h"

namespace lumacast::media {

/// A file as it was when it was listed.
struct ListedFile {
    std::string name;
    dev_t device = 0;
    ino_t inode = 0;
    struct timespec changed = {};  ///< by the file system's clock; nobody can set it back
};

/// One file, by its descriptor. On one thread; every call may wait for the disk. What was appended to a file is taken
/// away again by the first failure, unless its beginning was overwritten before: a disk that is full is left as it was.
class StoredMovie final : public mp4::BoxSource, public mp4::BoxSink {
public:
    std::uint64_t size() const override { return size_; }
    bool read(std::uint64_t offset, std::span<std::uint8_t> bytes) override;
    bool append(std::span<const std::uint8_t> bytes) override;
    bool overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) override;
    bool sync() override;

    /// The number of the first error of writing; 0: none.
    int error() const { return error_; }
    /// Whether somebody is writing it: a recording or an export.
    bool isBeingWritten() const;
    /// Gives it the times of access and modification that it had when it was opened.
    void restoreTimes();

private:
    friend class MovieFolder;
    StoredMovie(Fd file, const struct stat& status, const std::atomic<bool>* cancelled);
    bool write(std::uint64_t offset, std::span<const std::uint8_t> bytes);
    void fail(int error);

    const Fd file_;
    const struct stat status_;
    const std::atomic<bool>* const cancelled_;
    std::uint64_t size_;
    bool isOverwritten_ = false;
    int error_ = 0;
};

/// The directory. On one thread; every call may wait for the disk.
class MovieFolder final {
public:
    /// Reached as the file system role reaches it; none when it is not there or is somebody else's.
    static std::optional<MovieFolder> open(const std::string& directory);

    /// This user's regular files in it, the last ones changed first; where there are more than `most`, those only.
    std::vector<ListedFile> list(std::size_t most) const;

    /// One of them for a look; null when it is no regular file of this user's any more.
    std::unique_ptr<StoredMovie> openToLook(const std::string& name) const;
    /// One of them to change it: null when it is not the file that was listed or was changed since, when somebody is
    /// writing it, or when it is gone. It is marked as being written. Reading fails once `cancelled`.
    std::unique_ptr<StoredMovie> openToChange(const ListedFile& listed, const std::atomic<bool>& cancelled) const;
    /// Takes the name away if it still is that file's. 0 or the error number.
    int remove(const ListedFile& listed) const;

private:
    explicit MovieFolder(Fd folder) : folder_(std::move(folder)) {}
    Fd folder_;
};

}  // namespace lumacast::media
