// What the contract suite can't ask for: a hung disk, permissions, and both ways of resolving names against attacks.
#include "linux/storage/LinuxFileSystem.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <map>

#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/linux_services/ModeOf.h"
#include "tests/unit/linux_services/Until.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

struct Disk {
    explicit Disk(std::chrono::milliseconds patience = 30s, std::chrono::milliseconds freeSizeStands = 1h) {
        LinuxFileSystem::Options options;
        options.freeSizeStands = freeSizeStands;
        options.root = scratch.path("root");
        options.patience = patience;
        options.beforeEachQuestion = [gate = gate] { gate->pass(); };
        options.bytesBeingWritten = [this](const std::string& path) -> std::optional<std::uint64_t> {
            const auto found = writers.find(path);
            return found == writers.end() ? std::nullopt : std::optional(found->second);
        };
        fileSystem.emplace(options);
        EXPECT_FALSE(fileSystem->prepare());
        directory = scratch.path("root") + std::string(kDeviceTemporaryDirectory);
    }
    ~Disk() { gate->open(); }

    ScratchDirectory scratch;
    std::shared_ptr<Gate> gate = std::make_shared<Gate>();
    std::map<std::string, std::uint64_t> writers;
    std::optional<LinuxFileSystem> fileSystem;
    std::string directory;
};

template <class T>
std::int64_t code(const Result<T>& result) {
    const Error* error = std::get_if<Error>(&result);
    return error ? error->code() : 0;
}

TEST(LinuxFileSystem, PreparingMakesTheParentsAndNotTheDirectory) {
    Disk disk;
    EXPECT_FALSE(disk.fileSystem->exists(disk.directory));
    EXPECT_EQ(modeOf(disk.scratch.path("root/private/var/mobile/Library")), 0700u);
    EXPECT_FALSE(disk.fileSystem->prepare()) << "a second start";
    EXPECT_FALSE(disk.fileSystem->createDirectory(disk.directory));
}

TEST(LinuxFileSystem, WhatIsMadeIsThisUsersAlone) {
    Disk disk;
    const mode_t before = ::umask(0);
    EXPECT_FALSE(disk.fileSystem->createDirectory(disk.directory));
    EXPECT_FALSE(disk.fileSystem->createDirectory(disk.directory + "/sub"));
    ::umask(before);
    EXPECT_EQ(modeOf(disk.directory), 0700u);
    EXPECT_EQ(modeOf(disk.directory + "/sub"), 0700u);
}

TEST(LinuxFileSystem, TheDirectoryThatWasRemovedIsMadeAgainWhenItsFreeSizeIsAskedFor) {
    Disk disk;
    EXPECT_EQ(code(disk.fileSystem->freeSize(disk.directory)), ENOENT) << "making it at first is not this one's business";
    EXPECT_FALSE(disk.fileSystem->createDirectory(disk.directory));
    for (const char* removed : {"root/private/var/mobile/Library/Lumacast", "root"}) {
        std::filesystem::remove_all(disk.scratch.path(removed));
        EXPECT_EQ(code(disk.fileSystem->attributes(disk.directory)), ENOENT);
        EXPECT_EQ(code(disk.fileSystem->freeSize(disk.directory + "/")), 0);
        EXPECT_EQ(modeOf(disk.directory), 0700u);
        EXPECT_EQ(modeOf(disk.scratch.path("root/private")), 0700u);
    }
}

TEST(LinuxFileSystem, ADiskThatIsBusyForAMomentHasTheFreeSizeThatItToldBefore) {
    Disk disk(1s);
    EXPECT_FALSE(disk.fileSystem->createDirectory(disk.directory));
    const auto told = disk.fileSystem->freeSize(disk.directory + "/");
    ASSERT_EQ(code(told), 0);
    disk.gate->shut();
    const auto meanwhile = disk.fileSystem->freeSize(disk.directory + "/");
    ASSERT_EQ(code(meanwhile), 0);
    EXPECT_EQ(std::get<std::uint64_t>(meanwhile), std::get<std::uint64_t>(told));
    EXPECT_EQ(code(disk.fileSystem->freeSize(disk.directory + "/a.mp4")), ETIMEDOUT) << "of another place nothing was told";
}

TEST(LinuxFileSystem, AFreeSizeDoesNotStandForLong) {
    Disk disk(1s, 0s);
    EXPECT_FALSE(disk.fileSystem->createDirectory(disk.directory));
    ASSERT_EQ(code(disk.fileSystem->freeSize(disk.directory)), 0);
    disk.gate->shut();
    EXPECT_EQ(code(disk.fileSystem->freeSize(disk.directory)), ETIMEDOUT);
}

TEST(LinuxFileSystem, WhatSomebodyElsePlantedInItsPlaceIsRefused) {
    Disk disk;
    const std::string elsewhere = disk.scratch.makeDirectory("elsewhere");
    disk.scratch.write("elsewhere/precious.mp4", "precious");
    std::filesystem::create_directory_symlink(elsewhere, disk.directory);
    EXPECT_EQ(code(disk.fileSystem->freeSize(disk.directory)), 0) << "one's own link";
    EXPECT_FALSE(disk.fileSystem->prepare());
    if (::geteuid() != 0) return;  // only the administrator can plant something in somebody else's name
    constexpr uid_t kSomebody = 65534;
    const auto expectRefused = [&] {
        EXPECT_EQ(code(disk.fileSystem->freeSize(disk.directory)), EACCES);
        EXPECT_EQ(code(disk.fileSystem->attributes(disk.directory)), EACCES);
        EXPECT_EQ(code(disk.fileSystem->list(disk.directory)), EACCES);
        EXPECT_EQ(disk.fileSystem->remove(disk.directory + "/precious.mp4")->code(), EACCES);
        EXPECT_EQ(disk.fileSystem->createDirectory(disk.directory + "/new")->code(), EACCES);
        EXPECT_EQ(disk.fileSystem->prepare()->code(), EACCES) << "at the start";
        EXPECT_EQ(ScratchDirectory::read(elsewhere + "/precious.mp4"), "precious");
    };
    ASSERT_EQ(::lchown(disk.directory.c_str(), kSomebody, kSomebody), 0);
    expectRefused();
    std::filesystem::remove(disk.directory);
    std::filesystem::create_directory(disk.directory);
    ASSERT_EQ(::lchown(disk.directory.c_str(), kSomebody, kSomebody), 0);
    expectRefused();
    // A link on the way.
    std::filesystem::remove(disk.directory);
    const std::string library = std::filesystem::path(disk.directory).parent_path().string();
    std::filesystem::remove(library);
    std::filesystem::create_directory_symlink(elsewhere, library);
    ASSERT_EQ(::lchown(library.c_str(), kSomebody, kSomebody), 0);
    EXPECT_EQ(disk.fileSystem->createDirectory(disk.directory)->code(), EACCES);
    EXPECT_FALSE(std::filesystem::exists(elsewhere + "/Lumacast"));
}

TEST(LinuxFileSystem, AHungDiskIsUnreadableAfter40Milliseconds) {
    Disk disk(40ms);
    ASSERT_TRUE(until(
        [&] { return !disk.fileSystem->createDirectory(disk.directory) || disk.fileSystem->exists(disk.directory); }));
    disk.gate->shut();
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_EQ(code(disk.fileSystem->attributes(disk.directory)), ETIMEDOUT);
    EXPECT_EQ(code(disk.fileSystem->freeSize(disk.directory)), ETIMEDOUT);
    EXPECT_FALSE(disk.fileSystem->exists(disk.directory));
    EXPECT_EQ(disk.fileSystem->createDirectory(disk.directory + "/x")->code(), ETIMEDOUT);
    EXPECT_GE(std::chrono::steady_clock::now() - begin, 160ms);
    EXPECT_EQ(disk.fileSystem->diskThreadCount(), 4u);
    for (int i = 0; i < 5; ++i) EXPECT_EQ(code(disk.fileSystem->freeSize(disk.directory)), ETIMEDOUT);
    EXPECT_EQ(disk.fileSystem->diskThreadCount(), 4u);
    disk.gate->open();
    EXPECT_TRUE(until([&] { return disk.fileSystem->exists(disk.directory); })) << "the disk came back";
}

TEST(LinuxFileSystem, AHungDiskSaysNoToTheQuestionForAUsersFile) {
    Disk disk(40ms);
    const std::string movie = disk.scratch.write("movie.mp4", "movie");
    const UserID user{::geteuid()};
    EXPECT_TRUE(until([&] { return disk.fileSystem->userMayReadAndRemove(user, movie); }));
    disk.gate->shut();
    EXPECT_FALSE(disk.fileSystem->userMayReadAndRemove(user, movie));
}

TEST(LinuxFileSystem, AFileBeingWrittenAnswersEvenOnAHungDisk) {
    Disk disk(40ms);
    ASSERT_TRUE(until(
        [&] { return !disk.fileSystem->createDirectory(disk.directory) || disk.fileSystem->exists(disk.directory); }));
    disk.writers[disk.directory + "/movie.mp4"] = 4711;
    disk.gate->shut();
    const auto answer = disk.fileSystem->attributes(disk.directory + "//movie.mp4");
    ASSERT_EQ(code(answer), 0);
    EXPECT_EQ(std::get<FileAttributes>(answer).size, 4711u);
    EXPECT_GT(std::get<FileAttributes>(answer).modified.secondsSince1970, 1.7e9);
    EXPECT_EQ(code(disk.fileSystem->attributes(disk.directory + "//other.mp4")), ETIMEDOUT);
}

TEST(LinuxFileSystem, AFileThatIsGoneIsGoneEvenWhileItIsBeingWritten) {
    Disk disk;
    ASSERT_FALSE(disk.fileSystem->createDirectory(disk.directory));
    disk.writers[disk.directory + "/movie.mp4"] = 4711;
    EXPECT_EQ(code(disk.fileSystem->attributes(disk.directory + "//movie.mp4")), ENOENT);
}

TEST(LinuxFileSystem, TheDirectoryItselfMayBeALinkOfTheAdministrators) {
    Disk disk;
    std::filesystem::create_symlink(disk.scratch.makeDirectory("big-disk"), disk.directory);
    disk.scratch.write("big-disk/movie.mp4", "12345");
    const auto top = disk.fileSystem->attributes(disk.directory + "/");
    ASSERT_EQ(code(top), 0);
    EXPECT_TRUE(std::get<FileAttributes>(top).isDirectory);
    EXPECT_EQ(std::get<0>(disk.fileSystem->list(disk.directory + "/")), std::vector<std::string>{"movie.mp4"});
    const auto file = disk.fileSystem->attributes(disk.directory + "//movie.mp4");
    ASSERT_EQ(code(file), 0);
    EXPECT_EQ(std::get<FileAttributes>(file).size, 5u);
}

TEST(LinuxFileSystem, ATreeTooDeepIsNotFollowedToItsEnd) {
    Disk disk;
    ASSERT_FALSE(disk.fileSystem->createDirectory(disk.directory));
    std::string deep = disk.directory;
    for (int i = 0; i < 80; ++i) deep += "/d";
    std::filesystem::create_directories(deep);
    const auto error = disk.fileSystem->remove(disk.directory + "/d");
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code(), ELOOP);
}

class Resolving : public testing::TestWithParam<Resolution> {};

TEST_P(Resolving, StaysBeneathWhateverIsPutInTheWay) {
    ScratchDirectory scratch;
    const std::string base = scratch.makeDirectory("base");
    scratch.write("secret", "x");
    scratch.write("base/sub/file", "x");
    std::filesystem::create_symlink("..", base + "/up");
    std::filesystem::create_symlink(scratch.path(), base + "/out");
    std::filesystem::create_symlink("sub", base + "/inner");
    const auto error = [&](const std::string& path) {
        const auto answer = resolveBeneath(base, path, GetParam());
        const int* number = std::get_if<int>(&answer);
        return number ? *number : 0;
    };
    EXPECT_EQ(error(base + "/sub/file"), 0);
    EXPECT_EQ(error(base + "//sub///file/"), 0);
    EXPECT_EQ(error(base), 0);
    EXPECT_EQ(error(base + "/up"), 0) << "the link itself, not what it leads to";
    for (const char* through : {"/up/secret", "/out/secret", "/inner/file", "/up/base/sub/file"}) {
        const int number = error(base + through);
        EXPECT_TRUE(number == ELOOP || number == ENOTDIR) << through << " " << number;
    }
    for (const char* outside : {"/..", "/../secret", "/sub/../file", "/sub/..", "/./sub", "x", "/sub/.."})
        EXPECT_EQ(error(base + outside), EACCES) << outside;
    EXPECT_EQ(error("/"), EACCES);
    EXPECT_EQ(error(""), EACCES);
    EXPECT_EQ(error(base + "/none/file"), ENOENT);
}

INSTANTIATE_TEST_SUITE_P(Ways, Resolving, testing::Values(availableResolution(), Resolution::Walk));

}  // namespace
}  // namespace lumacast
