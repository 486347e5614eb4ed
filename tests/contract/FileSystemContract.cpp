#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <functional>
#include <map>

#include "linux/storage/LinuxFileSystem.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/FakeFileSystem.h"

namespace lumacast {
namespace {

using ::testing::UnorderedElementsAre;

constexpr std::string_view kDirectory = "/private/var/mobile/Library/Lumacast";

/// A file system whose temporary directory is not there yet; its parents are.
class FileSystemWorld {
public:
    virtual ~FileSystemWorld() = default;
    virtual FileSystem& fileSystem() = 0;
    /// A file of that many bytes, last written an hour ago.
    virtual void addOldFile(const std::string& path, std::uint64_t size) = 0;
    /// A link to another file or folder.
    virtual void addLink(const std::string& path, const std::string& target) = 0;
    /// A writer has written so many bytes to a file it made, whether or not they are on the disk.
    virtual void writeThroughWriter(const std::string& path, std::uint64_t bytes) = 0;
    virtual Date now() const = 0;
    /// A user this process can act for, and one who has no rights to that user's files.
    virtual UserID user() const = 0;
    virtual UserID stranger() const = 0;
    /// A file of `user`'s outside of the temporary directory; its path.
    virtual std::string addUsersFile(const std::string& name, std::uint64_t size) = 0;
    /// Whether a file stands at any path.
    virtual bool isThere(const std::string& path) = 0;
};

class FakeFileSystemWorld final : public FileSystemWorld {
public:
    FileSystem& fileSystem() override { return fileSystem_; }
    void addOldFile(const std::string& path, std::uint64_t size) override {
        fileSystem_.addFile(path, size, Date{now().secondsSince1970 - 3600});
    }
    void addLink(const std::string& path, const std::string&) override { fileSystem_.addLink(path); }
    void writeThroughWriter(const std::string& path, std::uint64_t bytes) override {
        auto made = fileSystem_.create(path);
        ASSERT_TRUE(std::holds_alternative<std::shared_ptr<FakeFile>>(made));
        ASSERT_TRUE(fileSystem_.append(*std::get<0>(made), bytes));
    }
    Date now() const override { return clock_.now(); }
    UserID user() const override { return UserID{1000}; }
    UserID stranger() const override { return UserID{1001}; }
    std::string addUsersFile(const std::string& name, std::uint64_t size) override {
        fileSystem_.addUsersFile(user(), "/home/user/" + name, size);
        return "/home/user/" + name;
    }
    bool isThere(const std::string& path) override { return fileSystem_.isThere(path); }

private:
    FakeClock clock_;
    FaultPlan faults_;
    FakeFileSystem fileSystem_{clock_, faults_, "/fake/root"};
};

class PortFileSystemWorld final : public FileSystemWorld {
public:
    /// `user` is one this process can act for: its own, or any when it is the administrator.
    explicit PortFileSystemWorld(Resolution resolution, uid_t user = ::geteuid())
        : user_(user), fileSystem_(options(resolution)) {
        EXPECT_FALSE(fileSystem_.prepare());
    }
    FileSystem& fileSystem() override { return fileSystem_; }
    void addOldFile(const std::string& path, std::uint64_t size) override {
        std::ofstream(path, std::ios::binary) << std::string(size, 'x');
        std::filesystem::last_write_time(path, std::filesystem::file_time_type::clock::now() - std::chrono::hours(1));
    }
    void addLink(const std::string& path, const std::string& target) override {
        std::filesystem::create_symlink(target, path);
    }
    void writeThroughWriter(const std::string& path, std::uint64_t bytes) override {
        std::ofstream(path, std::ios::binary).flush();
        writers_[path] = bytes;
    }
    Date now() const override {
        return Date{std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count()};
    }
    UserID user() const override { return UserID{user_}; }
    UserID stranger() const override { return UserID{54321}; }
    std::string addUsersFile(const std::string& name, std::uint64_t size) override {
        std::filesystem::permissions(scratch_.path(), std::filesystem::perms(0755));
        const std::string home = scratch_.makeDirectory("users home");
        const std::string path = scratch_.write("users home/" + name, std::string(size, 'x'));
        EXPECT_EQ(::chown(home.c_str(), user_, user_), 0);
        EXPECT_EQ(::chown(path.c_str(), user_, user_), 0);
        std::filesystem::permissions(home, std::filesystem::perms(0700));
        return path;
    }
    bool isThere(const std::string& path) override { return std::filesystem::exists(path); }

private:
    LinuxFileSystem::Options options(Resolution resolution) {
        LinuxFileSystem::Options result;
        result.root = scratch_.path();
        result.resolution = resolution;
        result.patience = std::chrono::seconds(30);  // this machine may be busy; its patience has a test of its own
        result.accounts = [](uid_t asked) { return std::optional(UserAccount{asked, asked, {asked}, "/"}); };
        result.bytesBeingWritten = [this](const std::string& path) -> std::optional<std::uint64_t> {
            const auto found = writers_.find(path);
            return found == writers_.end() ? std::nullopt : std::optional(found->second);
        };
        return result;
    }

    const uid_t user_;
    ScratchDirectory scratch_;
    std::map<std::string, std::uint64_t> writers_;
    LinuxFileSystem fileSystem_;
};

using Maker = std::function<std::unique_ptr<FileSystemWorld>()>;

class FileSystemContract : public ::testing::TestWithParam<Maker> {
protected:
    /// What the names of files are joined to: with a slash at its end, and then another one.
    std::string path(const std::string& name) const { return directory_ + "//" + name; }
    void makeDirectory() { ASSERT_FALSE(fileSystem_.createDirectory(directory_ + "/")); }
    static std::int64_t code(const std::optional<Error>& error) {
        if (!error) return 0;
        EXPECT_EQ(error->domain(), kSystemErrorDomain);
        return error->code();
    }
    template <class T>
    static std::int64_t code(const Result<T>& result) {
        const Error* error = std::get_if<Error>(&result);
        return error ? code(std::optional(*error)) : 0;
    }
    FileAttributes attributes(const std::string& name) {
        const auto answer = fileSystem_.attributes(path(name));
        EXPECT_EQ(code(answer), 0) << name;
        return std::holds_alternative<FileAttributes>(answer) ? std::get<FileAttributes>(answer) : FileAttributes{};
    }

    std::unique_ptr<FileSystemWorld> world_ = GetParam()();
    FileSystem& fileSystem_ = world_->fileSystem();
    const std::string directory_ = fileSystem_.root() + std::string(kDirectory);
};

TEST_P(FileSystemContract, TheRootHasNoSlashAtItsEnd) { EXPECT_FALSE(fileSystem_.root().ends_with('/')); }

TEST_P(FileSystemContract, TheTemporaryDirectoryIsThereOnceItWasMade) {
    EXPECT_FALSE(fileSystem_.exists(directory_ + "/"));
    makeDirectory();
    EXPECT_TRUE(fileSystem_.exists(directory_ + "/"));
    EXPECT_TRUE(fileSystem_.exists(directory_));
    EXPECT_EQ(code(fileSystem_.createDirectory(directory_)), EEXIST);
    const auto answer = fileSystem_.attributes(directory_ + "/");
    ASSERT_EQ(code(answer), 0);
    EXPECT_TRUE(std::get<FileAttributes>(answer).isDirectory);
    EXPECT_GT(std::get<FileAttributes>(answer).size, 0u);
}

TEST_P(FileSystemContract, ParentsAreNotMade) {
    EXPECT_EQ(code(fileSystem_.createDirectory(path("sub"))), ENOENT);
    makeDirectory();
    EXPECT_EQ(code(fileSystem_.createDirectory(path("a/b"))), ENOENT);
    EXPECT_EQ(code(fileSystem_.createDirectory(path("a"))), 0);
    EXPECT_EQ(code(fileSystem_.createDirectory(path("a/b"))), 0);
    EXPECT_TRUE(fileSystem_.exists(path("a/b")));
}

TEST_P(FileSystemContract, AFileHasItsAttributes) {
    makeDirectory();
    world_->addOldFile(path("movie.mp4"), 12345);
    const FileAttributes file = attributes("movie.mp4");
    EXPECT_EQ(file.size, 12345u);
    EXPECT_FALSE(file.isDirectory);
    EXPECT_NEAR(secondsBetween(file.modified, world_->now()), 3600, 60);
    if (file.created) {
        EXPECT_NEAR(secondsBetween(*file.created, world_->now()), 0, 60);
    }
}

TEST_P(FileSystemContract, AFileBeingWrittenHasTheBytesOfItsWriter) {
    makeDirectory();
    world_->writeThroughWriter(directory_ + "/movie.mp4", 777);
    EXPECT_EQ(attributes("movie.mp4").size, 777u);
}

TEST_P(FileSystemContract, WhatIsNotThereIsAnError) {
    makeDirectory();
    EXPECT_FALSE(fileSystem_.exists(path("nothing")));
    EXPECT_EQ(code(fileSystem_.attributes(path("nothing"))), ENOENT);
    EXPECT_EQ(code(fileSystem_.remove(path("nothing"))), ENOENT);
    EXPECT_EQ(code(fileSystem_.move(path("nothing"), path("something"))), ENOENT);
    EXPECT_EQ(code(fileSystem_.list(path("nothing"))), ENOENT);
    EXPECT_EQ(code(fileSystem_.freeSize(path("nothing"))), ENOENT);
}

TEST_P(FileSystemContract, AListNamesEverythingButDots) {
    makeDirectory();
    EXPECT_TRUE(std::get<0>(fileSystem_.list(directory_ + "/")).empty());
    world_->addOldFile(path("one.mp4"), 1);
    world_->addOldFile(path(".two"), 1);
    ASSERT_FALSE(fileSystem_.createDirectory(path("three")));
    world_->addOldFile(path("three/inside"), 1);
    const auto names = fileSystem_.list(directory_ + "/");
    ASSERT_EQ(code(names), 0);
    EXPECT_THAT(std::get<0>(names), UnorderedElementsAre("one.mp4", ".two", "three"));
    EXPECT_EQ(code(fileSystem_.list(path("one.mp4"))), ENOTDIR);
}

TEST_P(FileSystemContract, ARemovedFileIsGone) {
    makeDirectory();
    world_->addOldFile(path("one.mp4"), 1);
    world_->addOldFile(path("two.mp4"), 1);
    EXPECT_EQ(code(fileSystem_.remove(path("one.mp4"))), 0);
    EXPECT_FALSE(fileSystem_.exists(path("one.mp4")));
    EXPECT_TRUE(fileSystem_.exists(path("two.mp4")));
}

TEST_P(FileSystemContract, ADirectoryIsRemovedWithWhatItHolds) {
    makeDirectory();
    ASSERT_FALSE(fileSystem_.createDirectory(path("a")));
    ASSERT_FALSE(fileSystem_.createDirectory(path("a/b")));
    world_->addOldFile(path("a/b/inside"), 1);
    world_->addOldFile(path("ab"), 1);
    EXPECT_EQ(code(fileSystem_.remove(path("a"))), 0);
    EXPECT_FALSE(fileSystem_.exists(path("a")));
    EXPECT_FALSE(fileSystem_.exists(path("a/b/inside")));
    EXPECT_TRUE(fileSystem_.exists(path("ab")));
}

TEST_P(FileSystemContract, AMovedFileKeepsItsBytesAndReplacesAnother) {
    makeDirectory();
    world_->addOldFile(path("one.mp4"), 111);
    world_->addOldFile(path("two.mp4"), 222);
    EXPECT_EQ(code(fileSystem_.move(path("one.mp4"), path("two.mp4"))), 0);
    EXPECT_FALSE(fileSystem_.exists(path("one.mp4")));
    EXPECT_EQ(attributes("two.mp4").size, 111u);
}

TEST_P(FileSystemContract, WhatLeavesTheTemporaryDirectoryIsRefused) {
    makeDirectory();
    ASSERT_FALSE(fileSystem_.createDirectory(path("a")));
    world_->addOldFile(path("movie.mp4"), 1);
    for (const std::string& outside :
         {path("../Lumacast/movie.mp4"), path("a/../movie.mp4"), path(".."), path("a/.."), directory_ + "Evil",
          std::string("/etc/passwd"), fileSystem_.root() + "/private"}) {
        EXPECT_FALSE(fileSystem_.exists(outside)) << outside;
        EXPECT_EQ(code(fileSystem_.attributes(outside)), EACCES) << outside;
        EXPECT_EQ(code(fileSystem_.createDirectory(outside)), EACCES) << outside;
        EXPECT_EQ(code(fileSystem_.list(outside)), EACCES) << outside;
        EXPECT_EQ(code(fileSystem_.remove(outside)), EACCES) << outside;
        EXPECT_EQ(code(fileSystem_.move(outside, path("x"))), EACCES) << outside;
        EXPECT_EQ(code(fileSystem_.move(path("movie.mp4"), outside)), EACCES) << outside;
        EXPECT_EQ(code(fileSystem_.freeSize(outside)), EACCES) << outside;
    }
    EXPECT_TRUE(fileSystem_.exists(path("movie.mp4")));
}

TEST_P(FileSystemContract, NothingIsReachedThroughALink) {
    makeDirectory();
    ASSERT_FALSE(fileSystem_.createDirectory(path("a")));
    world_->addOldFile(path("a/movie.mp4"), 1);
    world_->addLink(path("within"), directory_ + "/a");
    world_->addLink(path("outside"), "/");
    for (const std::string name : {"within/movie.mp4", "outside/etc"}) {
        EXPECT_FALSE(fileSystem_.exists(path(name))) << name;
        EXPECT_NE(code(fileSystem_.attributes(path(name))), 0) << name;
        EXPECT_NE(code(fileSystem_.remove(path(name))), 0) << name;
        EXPECT_NE(code(fileSystem_.createDirectory(path(name) + "x")), 0) << name;
        EXPECT_NE(code(fileSystem_.move(path(name), path("x"))), 0) << name;
    }
    EXPECT_TRUE(fileSystem_.exists(path("a/movie.mp4")));
}

TEST_P(FileSystemContract, ARemovedLinkLeavesWhatItNamed) {
    makeDirectory();
    ASSERT_FALSE(fileSystem_.createDirectory(path("a")));
    world_->addOldFile(path("a/movie.mp4"), 1);
    world_->addLink(path("link"), directory_ + "/a");
    EXPECT_TRUE(fileSystem_.exists(path("link")));
    EXPECT_FALSE(attributes("link").isDirectory);
    EXPECT_EQ(code(fileSystem_.remove(path("link"))), 0);
    EXPECT_FALSE(fileSystem_.exists(path("link")));
    EXPECT_TRUE(fileSystem_.exists(path("a/movie.mp4")));
}

TEST_P(FileSystemContract, ANameWithAZeroByteIsRefused) {
    makeDirectory();
    world_->addOldFile(path("movie.mp4"), 1);
    const std::string trick = path("movie.mp4") + std::string("\0x", 2);
    EXPECT_FALSE(fileSystem_.exists(trick));
    EXPECT_NE(code(fileSystem_.remove(trick)), 0);
    EXPECT_TRUE(fileSystem_.exists(path("movie.mp4")));
}

TEST_P(FileSystemContract, TheDiskHasRoom) {
    EXPECT_EQ(code(fileSystem_.freeSize(directory_ + "/")), ENOENT);
    makeDirectory();
    const auto free = fileSystem_.freeSize(directory_ + "/");
    ASSERT_EQ(code(free), 0);
    EXPECT_GT(std::get<std::uint64_t>(free), 0u);
}

TEST_P(FileSystemContract, AUserMayReadAndRemoveItsOwnFileAndNobodyElseMay) {
    const std::string movie = world_->addUsersFile("movie.mp4", 100);
    EXPECT_TRUE(fileSystem_.userMayReadAndRemove(world_->user(), movie));
    EXPECT_FALSE(fileSystem_.userMayReadAndRemove(world_->stranger(), movie));
    EXPECT_FALSE(fileSystem_.userMayReadAndRemove(kNoUser, movie));
    const std::int64_t refusal = code(fileSystem_.removeForUser(world_->stranger(), movie));
    EXPECT_TRUE(refusal == EACCES || refusal == EPERM) << refusal;
    EXPECT_NE(code(fileSystem_.removeForUser(kNoUser, movie)), 0);
    EXPECT_TRUE(world_->isThere(movie)) << "a question and a refusal remove nothing";

    EXPECT_EQ(code(fileSystem_.removeForUser(world_->user(), movie)), 0);
    EXPECT_FALSE(world_->isThere(movie));
    EXPECT_FALSE(fileSystem_.userMayReadAndRemove(world_->user(), movie));
    EXPECT_EQ(code(fileSystem_.removeForUser(world_->user(), movie)), ENOENT);
}

TEST_P(FileSystemContract, AUsersPathThatNamesNoFileIsRefused) {
    const std::string movie = world_->addUsersFile("movie.mp4", 100);
    const std::string folder = movie.substr(0, movie.rfind('/'));
    for (const std::string& path : {std::string(), std::string("/"), std::string("movie.mp4"), movie + "/", folder,
                                    folder + "/..", movie + std::string("\0x", 2)}) {
        EXPECT_FALSE(fileSystem_.userMayReadAndRemove(world_->user(), path)) << path;
        EXPECT_NE(code(fileSystem_.removeForUser(world_->user(), path)), 0) << path;
    }
    EXPECT_TRUE(world_->isThere(movie));
}

INSTANTIATE_TEST_SUITE_P(Fake, FileSystemContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeFileSystemWorld>(); })));
INSTANTIATE_TEST_SUITE_P(
    Port, FileSystemContract,
    ::testing::Values(Maker([] { return std::make_unique<PortFileSystemWorld>(availableResolution()); }),
                      Maker([] { return std::make_unique<PortFileSystemWorld>(Resolution::Walk); }),
                      // For another user, where this process is the administrator (else for its own).
                      Maker([] {
                          const uid_t user = ::geteuid() == 0 ? 12345 : ::geteuid();
                          return std::make_unique<PortFileSystemWorld>(availableResolution(), user);
                      })));

}  // namespace
}  // namespace lumacast
