#include "linux/media/StoredMovie.h"

#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <utility>

#include "linux/calls/FileCalls.h"
#include "linux/storage/BeneathDirectory.h"
#include "linux/system/FileLock.h"

namespace lumacast::media {

namespace {

bool isOwnRegularFile(const struct stat& status) {
    return S_ISREG(status.st_mode) && status.st_uid == ::geteuid();
}

bool isSameFile(const ListedFile& listed, const struct stat& status) {
    return status.st_dev == listed.device && status.st_ino == listed.inode;
}

bool isSameMoment(const struct timespec& a, const struct timespec& b) {
    return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

bool isLater(const struct timespec& a, const struct timespec& b) {
    return a.tv_sec != b.tv_sec ? a.tv_sec > b.tv_sec : a.tv_nsec > b.tv_nsec;
}

/// Follows no link, and waits for nobody, as the opening of a pipe would.
Fd openIn(int folder, const std::string& name, int mode, struct stat& status) {
    Fd file(calls::openAt(folder, name, mode | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (file && (::fstat(file.get(), &status) != 0 || !isOwnRegularFile(status))) file.reset();
    return file;
}

}  // namespace

StoredMovie::StoredMovie(Fd file, const struct stat& status, const std::atomic<bool>* cancelled)
    : file_(std::move(file)),
      status_(status),
      cancelled_(cancelled),
      size_(static_cast<std::uint64_t>(status.st_size)) {}

bool StoredMovie::read(std::uint64_t offset, std::span<std::uint8_t> bytes) {
    if (cancelled_ && cancelled_->load(std::memory_order_relaxed)) return false;
    while (!bytes.empty()) {
        const ssize_t count = ::pread(file_.get(), bytes.data(), bytes.size(), static_cast<off_t>(offset));
        if (count < 0 && errno == EINTR) continue;
        if (count <= 0) return false;
        offset += static_cast<std::uint64_t>(count);
        bytes = bytes.subspan(static_cast<std::size_t>(count));
    }
    return true;
}

bool StoredMovie::write(std::uint64_t offset, std::span<const std::uint8_t> bytes) {
    while (!bytes.empty() && error_ == 0) {
        const ssize_t count = calls::writeAt(file_.get(), bytes.data(), bytes.size(), static_cast<off_t>(offset));
        if (count <= 0) {
            fail(count < 0 ? errno : EIO);
            break;
        }
        offset += static_cast<std::uint64_t>(count);
        bytes = bytes.subspan(static_cast<std::size_t>(count));
    }
    return error_ == 0;
}

bool StoredMovie::append(std::span<const std::uint8_t> bytes) {
    if (!write(size_, bytes)) return false;
    size_ += bytes.size();
    return true;
}

bool StoredMovie::overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) {
    isOverwritten_ = true;
    return write(offset, bytes);
}

bool StoredMovie::sync() {
    if (error_ == 0 && calls::syncData(file_.get()) != 0) {
        if (errno == EINVAL || errno == EROFS) return true;  // not a file that can be synced
        error_ = errno;
    }
    return error_ == 0;
}

bool StoredMovie::isBeingWritten() const { return lumacast::isBeingWritten(file_.get()); }

void StoredMovie::fail(int error) {
    error_ = error;
    if (!isOverwritten_ && calls::truncate(file_.get(), status_.st_size) == 0)
        size_ = static_cast<std::uint64_t>(status_.st_size);
}

void StoredMovie::restoreTimes() {
    const struct timespec times[] = {status_.st_atim, status_.st_mtim};
    (void)::futimens(file_.get(), times);  // what can't be restored counts from now
}

std::optional<MovieFolder> MovieFolder::open(const std::string& directory) {
    const auto place = openTrusted(withSingleSlashes(directory));
    const auto* const found = std::get_if<Fd>(&place);
    if (!found) return std::nullopt;
    Fd folder(calls::openAt(found->get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!folder) return std::nullopt;
    return MovieFolder(std::move(folder));
}

std::vector<ListedFile> MovieFolder::list(std::size_t most) const {
    const auto isNewer = [](const ListedFile& a, const ListedFile& b) { return isLater(a.changed, b.changed); };
    std::vector<ListedFile> files;  // a heap, the oldest first
    // A description of its own, which begins at the first name.
    Fd names(calls::openAt(folder_.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    DIR* const entries = names ? ::fdopendir(names.get()) : nullptr;
    if (!entries) return files;
    (void)names.release();  // it is closed with the stream
    while (const dirent* const entry = ::readdir(entries)) {
        struct stat status = {};
        if (::fstatat(folder_.get(), entry->d_name, &status, AT_SYMLINK_NOFOLLOW) != 0 || !isOwnRegularFile(status)) continue;
        files.push_back({entry->d_name, status.st_dev, status.st_ino, status.st_ctim});
        std::push_heap(files.begin(), files.end(), isNewer);
        if (files.size() <= most) continue;
        std::pop_heap(files.begin(), files.end(), isNewer);
        files.pop_back();
    }
    ::closedir(entries);
    std::sort_heap(files.begin(), files.end(), isNewer);
    return files;
}

std::unique_ptr<StoredMovie> MovieFolder::openToLook(const std::string& name) const {
    struct stat status = {};
    Fd file = openIn(folder_.get(), name, O_RDONLY, status);
    if (!file) return nullptr;
    return std::unique_ptr<StoredMovie>(new StoredMovie(std::move(file), status, nullptr));
}

std::unique_ptr<StoredMovie> MovieFolder::openToChange(const ListedFile& listed,
                                                       const std::atomic<bool>& cancelled) const {
    struct stat status = {};
    Fd file = openIn(folder_.get(), listed.name, O_RDWR, status);
    // A number is given to another file as soon as the first one is gone; that one's moment is later.
    if (!file || !isSameFile(listed, status) || !isSameMoment(listed.changed, status.st_ctim)) return nullptr;
    if (!markBeingWritten(file.get())) return nullptr;
    return std::unique_ptr<StoredMovie>(new StoredMovie(std::move(file), status, &cancelled));
}

int MovieFolder::remove(const ListedFile& listed) const {
    struct stat status = {};
    if (::fstatat(folder_.get(), listed.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) return errno;
    if (!isSameFile(listed, status)) return EEXIST;
    return calls::unlinkAt(folder_.get(), listed.name) == 0 ? 0 : errno;
}

}  // namespace lumacast::media
