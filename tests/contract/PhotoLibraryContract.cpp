#include <gtest/gtest.h>
#include <sys/stat.h>

#include <functional>
#include <set>
#include <thread>

#include "linux/library/LinuxPhotoLibrary.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/contract/SmallDisk.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/FakePhotoLibrary.h"

namespace lumacast {
namespace {

/// An empty library of a user this process can act for, and movies to put into it.
class PhotoLibraryWorld {
public:
    virtual ~PhotoLibraryWorld() = default;
    virtual PhotoLibrary& library() = 0;
    virtual UserID user() const = 0;
    /// A user for whom this process can't act.
    virtual UserID stranger() const = 0;
    /// A movie of so many bytes, told from every other one by `seed`.
    virtual URL addMovie(const std::string& name, std::size_t size, char seed) = 0;
    virtual URL addFolder(const std::string& name) = 0;
    /// Whether the file at a URL holds just what addMovie made of these.
    virtual bool holds(const URL& file, std::size_t size, char seed) = 0;
    /// How many entries there are in the library, whatever they are called.
    virtual std::size_t entries() = 0;
    /// Runs `action` while the library's disk has less room than `size`.
    virtual void whileTheDiskIsFull(std::size_t size, const std::function<void()>& action) = 0;
    /// From now on nothing can be written into the library, which is there.
    virtual void takeRightsAway() = 0;
};

class FakePhotoLibraryWorld final : public PhotoLibraryWorld {
public:
    PhotoLibrary& library() override { return library_; }
    UserID user() const override { return UserID{1000}; }
    UserID stranger() const override { return kNoUser; }
    URL addMovie(const std::string& name, std::size_t size, char seed) override {
        auto movie = std::make_shared<FakeMovie>();
        movies_[movie.get()] = {size, seed};
        const std::string path = "/home/user/" + name;
        files_.addUsersFile(user(), path, size, std::move(movie));
        return URL::file(path);
    }
    URL addFolder(const std::string& name) override {
        EXPECT_FALSE(files_.createDirectory(files_.temporaryDirectory()));
        EXPECT_FALSE(files_.createDirectory(files_.temporaryDirectory() + "/" + name));
        return URL::file(files_.temporaryDirectory() + "/" + name);
    }
    bool holds(const URL& file, std::size_t size, char seed) override {
        for (const auto& asset : library_.assets())
            if (asset.file == file) return movies_[asset.content.get()] == std::pair(size, seed);
        return false;
    }
    std::size_t entries() override { return library_.assets().size(); }
    void whileTheDiskIsFull(std::size_t, const std::function<void()>& action) override {
        faults_.failNext("PhotoLibrary.addVideo");
        action();
    }
    void takeRightsAway() override { library_.takeRightsAway(); }

private:
    FakeClock clock_;
    FaultPlan faults_;
    FakeFileSystem files_{clock_, faults_, "/fake/root"};
    FakePhotoLibrary library_{files_, faults_};
    std::map<const FakeMovie*, std::pair<std::size_t, char>> movies_;
};

std::string bytesOf(std::size_t size, char seed) {
    std::string bytes(size, '\0');
    for (std::size_t i = 0; i < size; ++i) bytes[i] = static_cast<char>(seed + static_cast<char>(i * 31 / 7));
    return bytes;
}

struct Way {
    Unseen unseen;
    CopyBy copyBy;
    bool asAnotherUser;
};

class PortPhotoLibraryWorld final : public PhotoLibraryWorld {
public:
    explicit PortPhotoLibraryWorld(Way way) : way_(way), user_(::geteuid()), library_(options()) {}
    PhotoLibrary& library() override { return library_; }
    UserID user() const override { return UserID{user_}; }
    UserID stranger() const override {
        return UserID{::geteuid() == 0 ? 54321u : ::geteuid() + 1u};  // one that has no account
    }
    URL addMovie(const std::string& name, std::size_t size, char seed) override {
        const std::string path = scratch_.write("movies/" + name, bytesOf(size, seed));
        EXPECT_EQ(::chown(path.c_str(), user_, user_), 0);
        return URL::file(path);
    }
    URL addFolder(const std::string& name) override { return URL::file(scratch_.makeDirectory(name)); }
    bool holds(const URL& file, std::size_t size, char seed) override {
        struct stat status = {};
        EXPECT_EQ(::stat(file.path().c_str(), &status), 0) << file.text();
        EXPECT_EQ(status.st_uid, user_);
        return ScratchDirectory::read(file.path()) == bytesOf(size, seed);
    }
    std::size_t entries() override {
        const std::string folder = scratch_.path("home/Videos/Lumacast");
        if (!std::filesystem::exists(folder)) return 0;
        return static_cast<std::size_t>(
            std::distance(std::filesystem::directory_iterator(folder), std::filesystem::directory_iterator()));
    }
    void whileTheDiskIsFull(std::size_t size, const std::function<void()>& action) override {
        makeFolder(scratch_.path("home/Videos"));
        const auto whileFull = [&] {
            EXPECT_EQ(::chown(scratch_.path("home/Videos").c_str(), user_, user_), 0);
            action();
        };
        if (withSmallDisk(scratch_.path("home/Videos"), std::to_string(size / 2), whileFull)) return;
        std::printf("no file system of its own here: the limit on a file's size stands for the full disk\n");
        const SmallFilesOnly limit(size / 2);
        action();
    }
    void takeRightsAway() override {
        makeFolder(scratch_.path("home/Videos"));
        // The administrator's rights are not taken away by a mode: for it a file stands where the folder would be.
        if (user_ == 0) {
            scratch_.write("home/Videos/Lumacast", "");
            return;
        }
        makeFolder(scratch_.path("home/Videos/Lumacast"));
        ASSERT_EQ(::chmod(scratch_.path("home/Videos/Lumacast").c_str(), 0555), 0);
    }

private:
    void makeFolder(const std::string& path) {
        std::filesystem::create_directories(path);
        EXPECT_EQ(::chown(path.c_str(), user_, user_), 0);
    }
    LinuxPhotoLibrary::Options options() {
        if (way_.asAnotherUser && ::geteuid() == 0) {
            user_ = 12345;
            EXPECT_EQ(::chmod(scratch_.path().c_str(), 0755), 0);
        }
        const std::string home = scratch_.makeDirectory("home");
        EXPECT_EQ(::chown(home.c_str(), user_, user_), 0);
        LinuxPhotoLibrary::Options result;
        result.home = home;
        result.configHome = home + "/.config";
        result.unseen = way_.unseen;
        result.copyBy = way_.copyBy;
        result.accounts = [home, user = user_](uid_t asked) -> std::optional<UserAccount> {
            if (asked != user) return std::nullopt;
            return UserAccount{user, user, {user}, home};
        };
        return result;
    }

    const Way way_;
    ScratchDirectory scratch_;
    uid_t user_;
    LinuxPhotoLibrary library_;
};

using Maker = std::function<std::unique_ptr<PhotoLibraryWorld>()>;

class PhotoLibraryContract : public ::testing::TestWithParam<Maker> {
protected:
    /// Where a copy is, or an empty URL and why there is none.
    URL add(const URL& movie) {
        const auto answer = library_.addVideo(movie, world_->user());
        if (const Error* error = std::get_if<Error>(&answer)) ADD_FAILURE() << movie.text() << ": " << describe(*error);
        return std::holds_alternative<URL>(answer) ? std::get<URL>(answer) : URL();
    }
    std::int64_t refusal(const URL& movie, UserID user) {
        const auto answer = library_.addVideo(movie, user);
        const Error* error = std::get_if<Error>(&answer);
        if (!error) return 0;
        EXPECT_EQ(error->domain(), kSystemErrorDomain);
        return error->code();
    }
    std::int64_t refusal(const URL& movie) { return refusal(movie, world_->user()); }

    std::unique_ptr<PhotoLibraryWorld> world_ = GetParam()();
    PhotoLibrary& library_ = world_->library();
};

TEST_P(PhotoLibraryContract, ACopyOfTheMovieIsInTheLibraryAndTheMovieStaysWhereItIs) {
    const URL movie = world_->addMovie("movie.mp4", 1'000'003, 'a');
    const URL copy = add(movie);
    EXPECT_FALSE(copy == movie);
    EXPECT_TRUE(copy.path().ends_with(".mp4")) << copy.text();
    EXPECT_TRUE(world_->holds(copy, 1'000'003, 'a'));
    EXPECT_EQ(world_->entries(), 1u);
    EXPECT_FALSE(add(movie) == copy);
}

TEST_P(PhotoLibraryContract, NothingIsEverReplaced) {
    std::vector<URL> copies;
    for (int i = 0; i < 12; ++i) {
        const char seed = static_cast<char>('a' + i);
        copies.push_back(add(world_->addMovie("movie" + std::to_string(i) + ".mp4", 1000, seed)));
    }
    EXPECT_EQ(world_->entries(), 12u);
    for (int i = 0; i < 12; ++i) EXPECT_TRUE(world_->holds(copies[i], 1000, static_cast<char>('a' + i))) << i;
}

TEST_P(PhotoLibraryContract, MoviesThatComeAtOnceAllGetPlacesOfTheirOwn) {
    std::vector<URL> movies, copies(8);
    for (int i = 0; i < 8; ++i)
        movies.push_back(world_->addMovie("m" + std::to_string(i) + ".mp4", 50'000, static_cast<char>('a' + i)));
    std::vector<std::thread> threads;
    for (int i = 0; i < 8; ++i) threads.emplace_back([&, i] { copies[i] = add(movies[i]); });
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(world_->entries(), 8u);
    for (int i = 0; i < 8; ++i) EXPECT_TRUE(world_->holds(copies[i], 50'000, static_cast<char>('a' + i))) << i;
}

TEST_P(PhotoLibraryContract, AnEmptyMovieIsCopiedToo) {
    EXPECT_TRUE(world_->holds(add(world_->addMovie("empty.mp4", 0, 'a')), 0, 'a'));
}

TEST_P(PhotoLibraryContract, WhatIsNoMovieFileIsAnErrorAndNothingIsAdded) {
    const std::string path = world_->addMovie("movie.mp4", 10, 'a').path();
    EXPECT_EQ(refusal(URL::file(path + "x")), ENOENT);
    EXPECT_EQ(refusal(URL("https://example.org/movie.mp4")), EINVAL);
    EXPECT_EQ(refusal(URL()), EINVAL);
    EXPECT_NE(refusal(world_->addFolder("folder")), 0);
    EXPECT_EQ(world_->entries(), 0u);
}

TEST_P(PhotoLibraryContract, AUserThisProcessCantActForIsRefused) {
    const URL movie = world_->addMovie("movie.mp4", 10, 'a');
    EXPECT_EQ(refusal(movie, world_->stranger()), EPERM);
    EXPECT_EQ(refusal(movie, kNoUser), EPERM);
    EXPECT_EQ(world_->entries(), 0u);
}

TEST_P(PhotoLibraryContract, AFullDiskIsAnErrorAndLeavesNothing) {
    constexpr std::size_t kSize = 4'000'000;
    const URL movie = world_->addMovie("movie.mp4", kSize, 'a');
    world_->whileTheDiskIsFull(kSize, [&] {
        const std::int64_t code = refusal(movie);
        EXPECT_TRUE(code == ENOSPC || code == EFBIG) << code;
        EXPECT_EQ(world_->entries(), 0u);
    });
    EXPECT_TRUE(world_->holds(add(movie), kSize, 'a')) << "once there is room";
}

TEST_P(PhotoLibraryContract, ALibraryThatCantBeWrittenIsAnError) {
    world_->takeRightsAway();
    const URL movie = world_->addMovie("movie.mp4", 10, 'a');
    const std::int64_t code = refusal(movie);
    EXPECT_TRUE(code == EACCES || code == ENOTDIR) << code;
    EXPECT_TRUE(world_->holds(movie, 10, 'a') || world_->entries() == 0);
}

INSTANTIATE_TEST_SUITE_P(Fake, PhotoLibraryContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakePhotoLibraryWorld>(); })));

Maker port(Way way) {
    return [way] { return std::make_unique<PortPhotoLibraryWorld>(way); };
}
// Every way to hide and to copy; and for another user, where this process is the administrator (else for its own).
INSTANTIATE_TEST_SUITE_P(Port, PhotoLibraryContract,
                         ::testing::Values(port({Unseen::WithoutName, CopyBy::Clone, false}),
                                           port({Unseen::HiddenName, CopyBy::Kernel, false}),
                                           port({Unseen::HiddenName, CopyBy::Hand, false}),
                                           port({Unseen::WithoutName, CopyBy::Clone, true}),
                                           port({Unseen::HiddenName, CopyBy::Hand, true})));

}  // namespace
}  // namespace lumacast
