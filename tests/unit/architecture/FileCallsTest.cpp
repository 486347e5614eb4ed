// What changes a disk or writes to a peer for a recording goes through linux/calls.

#include <gtest/gtest.h>

#include <cctype>
#include <string>
#include <vector>

#include "tests/unit/architecture/SourceText.h"

namespace lumacast::architecture {
namespace {

constexpr std::string_view kRecordingFolders[] = {"linux/media", "linux/storage", "linux/library", "linux/ipc"};

/// Names that only the system has.
constexpr std::string_view kCalls[] = {"openat",   "SYS_openat2", "creat",     "pwrite",          "pwritev",        "writev",
                                       "fsync",    "fdatasync", "ftruncate", "renameat",        "renameat2",      "unlinkat",
                                       "mkdirat",  "linkat",   "fstatvfs",  "fallocate",       "sync_file_range", "sendmsg",
                                       "sendmmsg", "sendfile", "symlinkat", "copy_file_range", "posix_fallocate", "FICLONE"};
/// Names that others have too: the system's is written "::name(".
constexpr std::string_view kQualified[] = {"open", "write", "rename", "unlink", "mkdir", "link", "send", "truncate", "sync"};

/// What has nothing to do with a recording.
struct Exception {
    std::string_view file, call;
};
constexpr Exception kExceptions[] = {
    {"linux/ipc/Reactor.cpp", "write"},        // wakes its own thread
    {"linux/ipc/ServiceSocket.cpp", "open"},   // the lock on the service's name, at the start
    {"linux/ipc/ServiceSocket.cpp", "unlink"},
};

bool isExcepted(std::string_view file, std::string_view call) {
    for (const Exception& each : kExceptions)
        if (each.file == file && each.call == call) return true;
    return false;
}

/// Whether `code` has "::name(" with nothing before the colons.
bool callsQualified(std::string_view code, std::string_view name) {
    const std::string wanted = "::" + std::string(name) + "(";
    for (auto at = code.find(wanted); at != std::string_view::npos; at = code.find(wanted, at + 1)) {
        const char before = at == 0 ? ' ' : code[at - 1];
        if (std::isalnum(static_cast<unsigned char>(before)) == 0 && before != '_' && before != '>') return true;
    }
    return false;
}

std::vector<std::string> directCalls(const SourceFile& file) {
    std::vector<std::string> found;
    const std::string code = codeOf(file.text);
    const auto add = [&](std::string_view name) {
        if (!isExcepted(file.path, name)) found.push_back(file.path + " calls " + std::string(name));
    };
    for (const std::string_view name : kCalls)
        if (usesName(code, name)) add(name);
    for (const std::string_view name : kQualified)
        if (callsQualified(code, name)) add(name);
    return found;
}

TEST(FileCalls, NoFolderOfARecordingGoesPastThem) {
    std::size_t files = 0;
    for (const std::string_view folder : kRecordingFolders) {
        for (const SourceFile& file : sourcesBelow(std::string(folder))) {
            ++files;
            for (const std::string& line : directCalls(file)) ADD_FAILURE() << line;
        }
    }
    EXPECT_GT(files, 80u) << "the tree was not found";
    for (const SourceFile& file : sourcesBelow("linux/system"))
        if (file.path.starts_with("linux/system/LinuxTelemetry"))
            for (const std::string& line : directCalls(file)) ADD_FAILURE() << line;
}

TEST(FileCalls, ADirectCallIsSeen) {
    const auto count = [](const std::string& text) { return directCalls({"linux/media/a.cpp", text}).size(); };
    EXPECT_EQ(count("if (::pwrite(f, b, n, 0) < 0) return ::fdatasync(f);"), 2u);
    EXPECT_EQ(count("sendmsg(socket, &message, 0);"), 1u);
    EXPECT_EQ(count("return ::write(f, b, n);\n(void)!::unlink(p);"), 2u);
    EXPECT_EQ(count("calls::write(f, b, n); stream.write(b); File::open(p); file->sync(); // ::write(x)"), 0u);
    EXPECT_EQ(directCalls({"linux/ipc/Reactor.cpp", "::write(wake, &one, 8);"}).size(), 0u);
    EXPECT_EQ(directCalls({"linux/ipc/Reactor.cpp", "::unlink(p);"}).size(), 1u);
}

}  // namespace
}  // namespace lumacast::architecture
