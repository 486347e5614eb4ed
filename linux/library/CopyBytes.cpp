#include "linux/library/CopyBytes.h"

#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <vector>

#include "linux/calls/FileCalls.h"

namespace lumacast {

namespace {

constexpr std::size_t kPiece = 4 * 1024 * 1024;
constexpr std::size_t kBuffer = 256 * 1024;

/// Starts writing back the piece that ends at `written`, and waits for the one before it. A hint: its failure is the
/// later sync's to report.
void writeBack(int file, std::uint64_t written) {
    const std::uint64_t begin = written / kPiece * kPiece;
    if (begin < kPiece) return;
    calls::startWriteBack(file, static_cast<off64_t>(begin - kPiece), kPiece, SYNC_FILE_RANGE_WRITE);
    if (begin >= 2 * kPiece)
        calls::startWriteBack(file, static_cast<off64_t>(begin - 2 * kPiece), kPiece,
                          SYNC_FILE_RANGE_WAIT_BEFORE | SYNC_FILE_RANGE_WRITE | SYNC_FILE_RANGE_WAIT_AFTER);
}

bool isNoRoom(int error) { return error == ENOSPC || error == EDQUOT || error == EFBIG; }

/// Whether the error says that these files can't be copied this way, not that the copying failed.
bool asksForAnotherWay(int error) {
    return error == EXDEV || error == EINVAL || error == ENOSYS || error == EOPNOTSUPP || error == EPERM ||
           error == EBADF || error == ETXTBSY;
}

int writeAll(int file, const char* bytes, std::size_t count) {
    while (count > 0) {
        const ssize_t written = calls::write(file, bytes, count);
        if (written < 0) return errno;
        if (written == 0) return EIO;
        bytes += written;
        count -= static_cast<std::size_t>(written);
    }
    return 0;
}

}  // namespace

int copyBytes(int from, int to, std::uint64_t size, CopyBy first) {
    if (first == CopyBy::Clone && calls::clone(from, to) == 0) return 0;
    if (size > 0 && calls::reserve(to, static_cast<off_t>(size)) != 0 && isNoRoom(errno))
        return errno;

    // Both descriptors' positions move along, so that the next way goes on where the one before gave up.
    std::uint64_t copied = 0;
    while (first != CopyBy::Hand) {
        const ssize_t count = calls::copyRange(from, to, kPiece);
        if (count < 0 && !asksForAnotherWay(errno)) return errno;
        if (count <= 0) break;
        copied += static_cast<std::uint64_t>(count);
        writeBack(to, copied);
    }
    // What the kernel says is the end may be only the end of what it can do (files whose bytes are made up as they are
    // read): read on until the file itself says so.
    std::vector<char> buffer(kBuffer);
    while (true) {
        const ssize_t count = ::read(from, buffer.data(), buffer.size());
        if (count < 0 && errno == EINTR) continue;
        if (count < 0) return errno;
        if (count == 0) break;
        if (const int error = writeAll(to, buffer.data(), static_cast<std::size_t>(count)); error != 0) return error;
        copied += static_cast<std::uint64_t>(count);
        writeBack(to, copied);
    }
    return copied >= size ? 0 : EIO;
}

}  // namespace lumacast
