#include "linux/calls/FileCalls.h"

#include <cerrno>

#include "linux/calls/SystemCalls.h"

namespace lumacast::calls {

namespace {

auto again(const auto& call) {
    for (;;) {
        const auto result = call();
        if (result >= 0 || errno != EINTR) return result;
    }
}

}  // namespace

int openAt(int folder, const std::string& path, int flags, mode_t mode) {
    return again([&] { return once::openAt(folder, path, flags, mode); });
}

int openResolved(int folder, const std::string& path, const open_how& how) {
    return again([&] { return once::openResolved(folder, path, how); });
}

int makeDirectoryAt(int folder, const std::string& path, mode_t mode) {
    return again([&] { return once::makeDirectoryAt(folder, path, mode); });
}

ssize_t write(int file, const void* bytes, std::size_t count) {
    return again([&] { return once::write(file, bytes, count); });
}

ssize_t writeAt(int file, const void* bytes, std::size_t count, off_t offset) {
    return again([&] { return once::writeAt(file, bytes, count, offset); });
}

ssize_t copyRange(int from, int to, std::size_t count) {
    return again([&] { return once::copyRange(from, to, count); });
}

int clone(int from, int to) {
    return again([&] { return once::clone(from, to); });
}

int reserve(int file, off_t size) {
    return again([&] { return once::reserve(file, size); });
}

int truncate(int file, off_t size) {
    return again([&] { return once::truncate(file, size); });
}

int sync(int file) {
    return again([&] { return once::sync(file); });
}

int syncData(int file) {
    return again([&] { return once::syncData(file); });
}

int startWriteBack(int file, off_t offset, off_t count, unsigned flags) {
    return again([&] { return once::startWriteBack(file, offset, count, flags); });
}

int rename(int fromFolder, const std::string& from, int toFolder, const std::string& to) {
    return again([&] { return once::rename(fromFolder, from, toFolder, to); });
}

int renameToNew(int fromFolder, const std::string& from, int toFolder, const std::string& to) {
    return again([&] { return once::renameToNew(fromFolder, from, toFolder, to); });
}

int link(int fromFolder, const std::string& from, int toFolder, const std::string& to, int flags) {
    return again([&] { return once::link(fromFolder, from, toFolder, to, flags); });
}

int unlinkAt(int folder, const std::string& path, int flags) {
    return again([&] { return once::unlinkAt(folder, path, flags); });
}

int statFileSystem(int file, struct statvfs& status) {
    return again([&] { return once::statFileSystem(file, status); });
}

ssize_t sendMessage(int socket, const msghdr& message, int flags) {
    return again([&] { return once::sendMessage(socket, message, flags); });
}

}  // namespace lumacast::calls
