// What the contract suite can't ask for: where the library is, what the copies are called, who is kept out.
#include "linux/library/LinuxPhotoLibrary.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <ctime>

#include "linux/library/LibraryFolder.h"
#include "linux/library/VideosFolder.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/contract/SmallDisk.h"

namespace lumacast {
namespace {

TEST(VideosFolder, BothFormsOfAUsersFolderAreRead) {
    const auto folder = [](std::string_view text) {
        return userDirectory(text, "XDG_VIDEOS_DIR", "/home/u").value_or("none");
    };
    EXPECT_EQ(folder("XDG_VIDEOS_DIR=\"$HOME/Filme\"\n"), "/home/u/Filme");
    EXPECT_EQ(folder("# comment\nXDG_MUSIC_DIR=\"$HOME/Musik\"\n  XDG_VIDEOS_DIR = \"/mnt/my films/\"  \n"),
              "/mnt/my films");
    EXPECT_EQ(folder("XDG_VIDEOS_DIR=\"$HOME/\""), "/home/u") << "a folder that was switched off";
    EXPECT_EQ(folder("XDG_VIDEOS_DIR=\"$HOME\""), "/home/u");
    EXPECT_EQ(folder("XDG_VIDEOS_DIR=\"$HOME/a\\\"b\\$c\\\\d\""), "/home/u/a\"b$c\\d");
    EXPECT_EQ(folder("XDG_VIDEOS_DIR=\"/a\"\nXDG_VIDEOS_DIR=\"/b\"\n"), "/b") << "the last one counts";
    for (const char* no : {"", "XDG_VIDEOS_DIR=", "XDG_VIDEOS_DIR=\"relative\"", "XDG_VIDEOS_DIR=$HOME/V",
                           "XDG_VIDEOS_DIR=\"$HOMER/V\"", "XDG_VIDEOS_DIR=\"/never ends", "#XDG_VIDEOS_DIR=\"/a\"",
                           "XDG_VIDEOS_DIRS=\"/a\"", "XDG_VIDEOS_DIR=\"/a\\"})
        EXPECT_EQ(folder(no), "none") << no;
}

TEST(VideosFolder, TheFileGoesBeforeTheEnvironmentAndBothBeforeTheUsualName) {
    const ScratchDirectory scratch;
    EXPECT_EQ(videosFolder("/home/u", scratch.path(), {}), "/home/u/Videos");
    EXPECT_EQ(videosFolder("/home/u", scratch.path(), "relative"), "/home/u/Videos");
    EXPECT_EQ(videosFolder("/home/u", scratch.path(), "/films/"), "/films");
    scratch.write("user-dirs.dirs", "XDG_VIDEOS_DIR=\"$HOME/Filme\"\n");
    EXPECT_EQ(videosFolder("/home/u", scratch.path(), "/films"), "/home/u/Filme");
}

struct World {
    explicit World(Unseen unseen = Unseen::WithoutName) {
        LinuxPhotoLibrary::Options options;
        options.home = scratch.makeDirectory("home");
        options.configHome = scratch.path("home/.config");
        options.unseen = unseen;
        options.accounts = [home = options.home](uid_t user) {
            return std::optional(UserAccount{user, user, {user}, home});
        };
        library.emplace(options);
    }
    std::string movie(const std::string& text = "movie", const std::string& name = "movie.mp4") {
        return scratch.write(name, text);
    }
    Result<URL> add(const std::string& path, uid_t user = ::geteuid()) {
        return library->addVideo(URL::file(path), UserID{user});
    }
    std::string folder() const { return scratch.path("home/Videos/Lumacast"); }

    ScratchDirectory scratch;
    std::optional<LinuxPhotoLibrary> library;
};

std::string pathOf(const Result<URL>& answer) {
    const Error* error = std::get_if<Error>(&answer);
    EXPECT_FALSE(error) << describe(*error);
    return error ? "" : std::get<URL>(answer).path();
}
std::int64_t code(const Result<URL>& answer) {
    const Error* error = std::get_if<Error>(&answer);
    return error ? error->code() : 0;
}
std::string nameOf(const std::string& path) { return path.substr(path.rfind('/') + 1); }

TEST(LinuxPhotoLibrary, AMovieIsCalledByTheLocalTimeOfItsLastChange) {
    World world;
    const std::string path = world.movie();
    tm local{};
    local.tm_year = 126, local.tm_mon = 4, local.tm_mday = 9, local.tm_hour = 17, local.tm_min = 3, local.tm_sec = 8;
    local.tm_isdst = -1;
    const timespec time{::mktime(&local), 0};
    const timespec times[] = {time, time};
    ASSERT_EQ(::utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
    EXPECT_EQ(pathOf(world.add(path)), world.folder() + "/Recording 2026-05-09 17-03-08.mp4");
    EXPECT_EQ(nameOf(pathOf(world.add(path))), "Recording 2026-05-09 17-03-08 (2).mp4");
    EXPECT_EQ(nameOf(pathOf(world.add(path))), "Recording 2026-05-09 17-03-08 (3).mp4");
}

TEST(LinuxPhotoLibrary, AMovieKeepsItsExtension) {
    World world;
    EXPECT_TRUE(pathOf(world.add(world.movie("m", "a.mov"))).ends_with(".mov"));
    EXPECT_TRUE(pathOf(world.add(world.movie("m", "without"))).ends_with(".mp4"));
    EXPECT_TRUE(pathOf(world.add(world.movie("m", ".hidden"))).ends_with(".mp4"));
    EXPECT_TRUE(pathOf(world.add(world.movie("m", "folder.x/without"))).ends_with(".mp4"));
    EXPECT_TRUE(pathOf(world.add(world.movie("m", "a.far too long for one"))).ends_with(".mp4"));
}

TEST(LinuxPhotoLibrary, ACopyIsTheOwnersAndForOthersAsTheUmaskSays) {
    World world;
    const std::string path = world.movie();
    ASSERT_EQ(::chmod(path.c_str(), 0400), 0);
    const mode_t before = ::umask(027);
    const std::string copy = pathOf(world.add(path));
    ::umask(before);
    struct stat status = {};
    ASSERT_EQ(::stat(copy.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0640u);
    EXPECT_EQ(status.st_uid, ::geteuid());
}

TEST(LinuxPhotoLibrary, TheFoldersThatWereMadeForAFailedSaveGoAgain) {
    World world;
    const std::string folder = world.scratch.makeDirectory("not a movie");
    EXPECT_EQ(code(world.add(folder)), EISDIR);
    EXPECT_FALSE(std::filesystem::exists(world.scratch.path("home/Videos")));
    std::filesystem::remove(world.scratch.path("home"));
    EXPECT_EQ(code(world.add(world.movie())), ENOENT) << "a home that is not there is not made";
}

TEST(LibraryFolder, WhatItMadeGoesAgainUnlessItIsKept) {
    const ScratchDirectory scratch;
    const std::string videos = scratch.path("Videos");
    {
        const auto folder = LibraryFolder::open(videos, ::geteuid());
        ASSERT_TRUE(std::holds_alternative<LibraryFolder>(folder));
        EXPECT_TRUE(std::filesystem::exists(videos + "/Lumacast"));
        EXPECT_EQ(std::get<LibraryFolder>(folder).sync(), 0);
    }
    EXPECT_FALSE(std::filesystem::exists(videos));
    scratch.makeDirectory("Videos");
    { const auto folder = LibraryFolder::open(videos, ::geteuid()); }
    EXPECT_TRUE(std::filesystem::exists(videos)) << "that one was there before";
    EXPECT_FALSE(std::filesystem::exists(videos + "/Lumacast"));
    {
        auto folder = LibraryFolder::open(videos, ::geteuid());
        ASSERT_TRUE(std::holds_alternative<LibraryFolder>(folder));
        std::get<LibraryFolder>(folder).keep();
    }
    EXPECT_TRUE(std::filesystem::exists(videos + "/Lumacast"));
}

TEST(LinuxPhotoLibrary, APipeIsNeitherReadNorWaitedFor) {
    World world;
    const std::string pipe = world.scratch.path("pipe.mp4");
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    EXPECT_EQ(code(world.add(pipe)), EACCES);
    std::filesystem::create_symlink(world.movie(), world.scratch.path("link.mp4"));
    EXPECT_EQ(code(world.add(world.scratch.path("link.mp4"))), ELOOP);
}

TEST(LinuxPhotoLibrary, TheUsersOwnLinkToTheFolderIsFollowedAndSomebodyElsesIsNot) {
    World world;
    world.scratch.makeDirectory("elsewhere");
    world.scratch.makeDirectory("home/Videos");
    std::filesystem::create_directory_symlink(world.scratch.path("elsewhere"), world.folder());
    EXPECT_TRUE(pathOf(world.add(world.movie())).starts_with(world.folder()));
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(world.scratch.path("elsewhere")), {}), 1);
    if (::geteuid() != 0) return;  // only the administrator makes somebody else's link
    ASSERT_EQ(::lchown(world.folder().c_str(), 12346, 12346), 0);
    EXPECT_EQ(code(world.add(world.movie())), EACCES);
    ASSERT_EQ(::lchown(world.folder().c_str(), 0, 0), 0);
    ASSERT_EQ(::chown(world.scratch.path("elsewhere").c_str(), 12346, 12346), 0);
    EXPECT_EQ(code(world.add(world.movie())), EACCES) << "a folder of somebody else's";
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(world.scratch.path("elsewhere")), {}), 1);
}

TEST(LinuxPhotoLibrary, ForAnotherUserItReadsThatUsersMoviesOrItsOwnAndNothingElse) {
    if (::geteuid() != 0) return;  // others can't act for another user: the contract suite asks for their refusal
    World world;
    constexpr uid_t kUser = 12345;
    ASSERT_EQ(::chmod(world.scratch.path().c_str(), 0755), 0);
    ASSERT_EQ(::chown(world.scratch.path("home").c_str(), kUser, kUser), 0);

    const std::string ofTheDaemon = world.movie("own", "temporary/own.mp4");
    ASSERT_EQ(::chmod(world.scratch.path("temporary").c_str(), 0700), 0);
    const std::string copy = pathOf(world.add(ofTheDaemon, kUser));
    struct stat status = {};
    ASSERT_EQ(::stat(copy.c_str(), &status), 0);
    EXPECT_EQ(status.st_uid, kUser);
    EXPECT_EQ(status.st_gid, kUser);
    ASSERT_EQ(::stat(world.folder().c_str(), &status), 0);
    EXPECT_EQ(status.st_uid, kUser);

    const std::string ofTheUser = world.movie("users", "home/users.mp4");
    ASSERT_EQ(::chown(ofTheUser.c_str(), kUser, kUser), 0);
    EXPECT_EQ(ScratchDirectory::read(pathOf(world.add(ofTheUser, kUser))), "users");

    // A path of the user's that now leads to a file that only the daemon may read.
    std::filesystem::create_directory_symlink(world.scratch.path("temporary"), world.scratch.path("home/planted"));
    ASSERT_EQ(::lchown(world.scratch.path("home/planted").c_str(), kUser, kUser), 0);
    EXPECT_EQ(code(world.add(world.scratch.path("home/planted/own.mp4"), kUser)), EACCES);
    std::filesystem::create_hard_link(ofTheDaemon, world.scratch.path("home/hard.mp4"));
    ASSERT_EQ(::chmod(ofTheDaemon.c_str(), 0600), 0);
    EXPECT_EQ(code(world.add(world.scratch.path("home/hard.mp4"), kUser)), EACCES);
}

TEST(LinuxPhotoLibrary, AnotherFileSystemIsCopiedTo) {
    for (const CopyBy copyBy : {CopyBy::Clone, CopyBy::Kernel, CopyBy::Hand}) {
        for (const Unseen unseen : {Unseen::WithoutName, Unseen::HiddenName}) {
            World world;
            LinuxPhotoLibrary::Options options;
            options.home = world.scratch.path("home");
            options.unseen = unseen;
            options.copyBy = copyBy;
            const LinuxPhotoLibrary library(options);
            const std::string text(3'000'001, 'm');
            const std::string movie = world.movie(text);
            const auto check = [&](const std::string& home) {
                options.home = home;
                const std::string copy =
                    pathOf(LinuxPhotoLibrary(options).addVideo(URL::file(movie), UserID{::geteuid()}));
                EXPECT_EQ(ScratchDirectory::read(copy), text);
                struct stat here = {}, there = {};
                ASSERT_EQ(::stat(movie.c_str(), &here), 0);
                ASSERT_EQ(::stat(copy.c_str(), &there), 0);
                EXPECT_NE(here.st_dev, there.st_dev) << "two file systems";
            };
            if (withSmallDisk(world.scratch.path("home"), "8m", [&] { check(world.scratch.path("home")); })) continue;
            char memory[] = "/dev/shm/lc-library-XXXXXX";
            ASSERT_TRUE(::mkdtemp(memory)) << "neither a file system of its own nor /dev/shm";
            check(memory);
            std::filesystem::remove_all(memory);
        }
    }
}

TEST(CopyBytes, AMovieThatBecameShorterIsNotCopied) {
    const ScratchDirectory scratch;
    for (const CopyBy copyBy : {CopyBy::Kernel, CopyBy::Hand}) {
        const Fd from(::open(scratch.write("movie", "12345").c_str(), O_RDONLY | O_CLOEXEC));
        const Fd to(::open(scratch.path("copy").c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
        EXPECT_EQ(copyBytes(from.get(), to.get(), 6, copyBy), EIO);
    }
}

TEST(CopyBytes, AMovieThatGrewIsCopiedWhole) {
    const ScratchDirectory scratch;
    for (const CopyBy copyBy : {CopyBy::Kernel, CopyBy::Hand}) {
        const Fd from(::open(scratch.write("movie", "12345").c_str(), O_RDONLY | O_CLOEXEC));
        const Fd to(::open(scratch.path("copy").c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
        EXPECT_EQ(copyBytes(from.get(), to.get(), 3, copyBy), 0);
        EXPECT_EQ(ScratchDirectory::read(scratch.path("copy")), "12345");
    }
}

TEST(CopyBytes, ADiskThatBecomesFullMeanwhileIsAnError) {
    const ScratchDirectory scratch;
    const std::string movie = scratch.write("movie", std::string(1'000'000, 'm'));
    const std::string small = scratch.makeDirectory("small");
    // As if the movie had been short when the room was asked for.
    const auto copy = [&](CopyBy copyBy) {
        const Fd from(::open(movie.c_str(), O_RDONLY | O_CLOEXEC));
        const Fd to(::open((small + "/copy").c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
        return copyBytes(from.get(), to.get(), 1, copyBy);
    };
    for (const CopyBy copyBy : {CopyBy::Kernel, CopyBy::Hand}) {
        if (withSmallDisk(small, "300k", [&] { EXPECT_EQ(copy(copyBy), ENOSPC); })) continue;
        const SmallFilesOnly limit(300'000);
        EXPECT_EQ(copy(copyBy), EFBIG);
    }
}

TEST(CopyBytes, AFileWhoseSizeIsNotKnownBeforehandIsReadToItsEnd) {
    const ScratchDirectory scratch;
    const Fd from(::open("/proc/self/status", O_RDONLY | O_CLOEXEC));
    const Fd to(::open(scratch.path("copy").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    EXPECT_EQ(copyBytes(from.get(), to.get(), 0, CopyBy::Clone), 0);
    EXPECT_TRUE(ScratchDirectory::read(scratch.path("copy")).starts_with("Name:"));
}

TEST(NewFile, WhatIsNotGivenANameLeavesNothing) {
    const ScratchDirectory scratch;
    const Fd folder(::open(scratch.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const auto entries = [&] { return std::distance(std::filesystem::directory_iterator(scratch.path()), {}); };
    for (const Unseen unseen : {Unseen::WithoutName, Unseen::HiddenName}) {
        {
            const auto file = NewFile::in(folder.get(), unseen);
            ASSERT_TRUE(std::holds_alternative<NewFile>(file));
            EXPECT_EQ(entries(), unseen == Unseen::HiddenName ? 1 : 0);
        }
        EXPECT_EQ(entries(), 0);
    }
}

TEST(NewFile, ATakenNameIsRefusedAndAnotherOneWillDo) {
    const ScratchDirectory scratch;
    const Fd folder(::open(scratch.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    scratch.write("taken", "mine");
    for (const Unseen unseen : {Unseen::WithoutName, Unseen::HiddenName}) {
        const std::string name = unseen == Unseen::HiddenName ? "hidden" : "unnamed";
        {
            auto file = NewFile::in(folder.get(), unseen);
            ASSERT_TRUE(std::holds_alternative<NewFile>(file));
            ASSERT_EQ(::write(std::get<NewFile>(file).get(), "new", 3), 3);
            EXPECT_EQ(std::get<NewFile>(file).giveName("taken"), EEXIST);
            EXPECT_EQ(std::get<NewFile>(file).giveName(name), 0);
        }
        EXPECT_EQ(ScratchDirectory::read(scratch.path(name)), "new");
        EXPECT_EQ(ScratchDirectory::read(scratch.path("taken")), "mine");
    }
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(scratch.path()), {}), 3) << "no hidden one stays";
}

}  // namespace
}  // namespace lumacast
