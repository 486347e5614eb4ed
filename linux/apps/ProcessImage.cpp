#include "linux/apps/ProcessImage.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <string_view>

#include "base/Utf8.h"

namespace lumacast {

namespace {

constexpr std::size_t kMaximumPath = 4096;
constexpr std::string_view kDeletedMark = " (deleted)";

/// Any process can show any path as that of a deleted file: in a mount namespace of its own, where it removes what it
/// runs. So the file must be gone for good, and its owner one who could have put it into that folder here.
bool canHaveBeenAt(const std::string& path, const struct stat& file) {
    struct stat folder = {};
    if (file.st_nlink != 0 || ::stat(path.substr(0, path.rfind('/') + 1).c_str(), &folder) != 0) return false;
    return file.st_uid == 0 || file.st_uid == folder.st_uid;
}

bool isSameFile(const struct stat& a, const struct stat& b) { return a.st_dev == b.st_dev && a.st_ino == b.st_ino; }

}  // namespace

Fd openProcess(ProcessID pid) {
    if (number(pid) <= 0) return {};
    return Fd(::open(("/proc/" + std::to_string(number(pid))).c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
}

std::optional<ProcessImage> processImage(ProcessID pid) { return processImage(openProcess(pid)); }

std::optional<ProcessImage> processImage(const Fd& process) {
    if (!process) return std::nullopt;
    std::array<char, kMaximumPath + kDeletedMark.size() + 1> buffer;
    const ssize_t length = ::readlinkat(process.get(), "exe", buffer.data(), buffer.size());
    ProcessImage image;
    if (length <= 0 || ::fstatat(process.get(), "exe", &image.status, 0) != 0) return std::nullopt;
    image.path.assign(buffer.data(), static_cast<std::size_t>(length));

    if (!image.path.starts_with('/') || image.path.starts_with("/memfd:")) return std::nullopt;
    // A file may well be called "x (deleted)": the kernel's mark stands where no such file is this image.
    struct stat here = {};
    bool isHere = ::stat(image.path.c_str(), &here) == 0 && isSameFile(here, image.status);
    if (!isHere && image.path.ends_with(kDeletedMark)) {
        image.path.resize(image.path.size() - kDeletedMark.size());
        image.deleted = isHere = canHaveBeenAt(image.path, image.status);
    }
    if (!isHere || image.path.size() > kMaximumPath || !isValidUtf8(image.path)) return std::nullopt;
    return image;
}

}  // namespace lumacast
