// Which files are a user's to read and to remove.
#include "linux/storage/UsersFiles.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <set>

#include "linux/system/UserRights.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast {
namespace {

constexpr uid_t kSomebody = 12345;
constexpr uid_t kSomebodyElse = 12346;

/// A folder in which a user asks: another one where this process is the administrator, else its own. What takes a
/// second user (files and links of somebody else's) only the administrator can make; the others leave it out.
class UsersFilesTest : public ::testing::Test {
protected:
    UsersFilesTest() {
        EXPECT_EQ(::chmod(scratch_.path().c_str(), 0755), 0);
        own(scratch_.makeDirectory("home"), user_);
    }
    static void own(const std::string& path, uid_t user) {
        EXPECT_EQ(::lchown(path.c_str(), user, user), 0) << path;
    }
    std::string file(const std::string& name, uid_t user) {
        const std::string path = scratch_.write("home/" + name, "movie");
        own(path, user);
        return path;
    }
    std::string folder(const std::string& name, uid_t user, mode_t mode) {
        const std::string path = scratch_.makeDirectory("home/" + name);
        own(path, user);
        EXPECT_EQ(::chmod(path.c_str(), mode), 0);
        return path;
    }
    int ask(const std::string& path) {
        return performAs(user_, accounts_, [&] { return mayReadAndRemove(path, user_); });
    }
    int remove(const std::string& path) {
        return performAs(user_, accounts_, [&] { return removeFile(path, user_); });
    }

    ScratchDirectory scratch_;
    const bool isAdministrator_ = ::geteuid() == 0;
    const uid_t user_ = isAdministrator_ ? kSomebody : ::geteuid();
    const uid_t other_ = isAdministrator_ ? kSomebodyElse : ::geteuid();
    const AccountLookup accounts_ = [](uid_t user) {
        return std::optional(UserAccount{user, user, {user, 777}, "/nowhere"});
    };
};

TEST_F(UsersFilesTest, AFileOfTheUsersIsItsToRemove) {
    const std::string path = file("movie.mp4", user_);
    EXPECT_EQ(ask(path), 0);
    EXPECT_EQ(remove(path), 0);
    EXPECT_EQ(ask(path), ENOENT);
}

TEST_F(UsersFilesTest, WhatTheUserCantReadIsNot) {
    const std::string path = file("movie.mp4", user_);
    ASSERT_EQ(::chmod(path.c_str(), 0), 0);
    EXPECT_EQ(ask(path), EACCES);
}

TEST_F(UsersFilesTest, WhatStandsInAFolderTheUserCantChangeIsNot) {
    folder("closed", user_, 0755);
    const std::string path = file("closed/movie.mp4", user_);
    ASSERT_EQ(::chmod(scratch_.path("home/closed").c_str(), 0555), 0);
    EXPECT_EQ(ask(path), EACCES);
    EXPECT_EQ(remove(path), EACCES);
    ASSERT_EQ(::chmod(scratch_.path("home/closed").c_str(), 0666), 0);
    EXPECT_EQ(ask(path), EACCES) << "not to be searched";
    ASSERT_EQ(::chmod(scratch_.path("home/closed").c_str(), 0755), 0);
}

TEST_F(UsersFilesTest, NoSearchOnTheWayIsARefusal) {
    folder("a", user_, 0755);
    folder("a/b", user_, 0755);
    const std::string path = file("a/b/movie.mp4", user_);
    EXPECT_EQ(ask(path), 0);
    ASSERT_EQ(::chmod(scratch_.path("home/a").c_str(), 0600), 0);
    EXPECT_EQ(ask(path), EACCES);
    ASSERT_EQ(::chmod(scratch_.path("home/a").c_str(), 0755), 0);
}

TEST_F(UsersFilesTest, InAStickyFolderOnlyTheOwnersRemove) {
    folder("shared", other_, 01777);
    const std::string own = file("shared/own.mp4", user_);
    const std::string others = file("shared/others.mp4", other_);
    EXPECT_EQ(ask(own), 0);
    EXPECT_EQ(ask(others), isAdministrator_ ? EACCES : 0);
    EXPECT_EQ(remove(others), isAdministrator_ ? EPERM : 0);
    folder("open", other_, 0777);
    EXPECT_EQ(ask(file("open/others.mp4", other_)), 0) << "without the bit the folder's rights are enough";
}

TEST_F(UsersFilesTest, TheGroupsOfTheUserCount) {
    if (!isAdministrator_) return;  // nobody else can give a folder to a group of its making
    const std::string shared = folder("shared", other_, 0770);
    const std::string path = file("shared/movie.mp4", other_);
    EXPECT_EQ(ask(path), EACCES);
    ASSERT_EQ(::chown(shared.c_str(), other_, 777), 0);
    EXPECT_EQ(ask(path), 0);
}

TEST_F(UsersFilesTest, ALinkOfTheUsersIsFollowedAndSomebodyElsesIsNot) {
    folder("real", user_, 0755);
    file("real/movie.mp4", user_);
    const std::set<uid_t> owners = isAdministrator_ ? std::set<uid_t>{user_, 0, other_} : std::set<uid_t>{user_};
    for (const uid_t owner : owners) {
        const std::string link = scratch_.path("home/link" + std::to_string(owner));
        std::filesystem::create_directory_symlink("real", link);
        own(link, owner);
        EXPECT_EQ(ask(link + "/movie.mp4"), owner == kSomebodyElse ? EACCES : 0) << owner;
    }
}

TEST_F(UsersFilesTest, OnlyARegularFileIsAMovie) {
    file("movie.mp4", user_);
    const std::string link = scratch_.path("home/link.mp4");
    std::filesystem::create_symlink("movie.mp4", link);
    own(link, user_);
    const std::string pipe = scratch_.path("home/pipe");
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    own(pipe, user_);
    EXPECT_EQ(ask(link), EACCES);
    EXPECT_EQ(ask(pipe), EACCES) << "and it is not waited for";
    EXPECT_EQ(ask(folder("folder", user_, 0755)), EISDIR);
    EXPECT_EQ(remove(scratch_.path("home/folder")), EISDIR);
    EXPECT_EQ(remove(link), 0);
    EXPECT_TRUE(std::filesystem::exists(scratch_.path("home/movie.mp4"))) << "the link went, not what it names";
}

TEST_F(UsersFilesTest, ThisThreadKeepsItsRights) {
    const uid_t before = ::geteuid();
    EXPECT_EQ(ask(file("movie.mp4", user_)), 0);
    EXPECT_EQ(::geteuid(), before);
    const std::string closed = scratch_.write("closed", "");
    ASSERT_EQ(::chmod(closed.c_str(), 0600), 0);
    EXPECT_EQ(ScratchDirectory::read(closed), "");
    EXPECT_EQ(::access(closed.c_str(), R_OK | W_OK), 0);
}

TEST(UserRights, OnlyTheAdministratorActsForSomebodyElse) {
    const auto nothing = [] { return 0; };
    const AccountLookup accounts = [](uid_t user) { return std::optional(UserAccount{user, user, {}, "/"}); };
    EXPECT_EQ(performAs(::geteuid(), accounts, nothing), 0);
    EXPECT_EQ(performAs(::geteuid() + 1, accounts, nothing), ::geteuid() == 0 ? 0 : EPERM);
    EXPECT_EQ(performAs(static_cast<uid_t>(-1), accounts, nothing), EPERM);
    const AccountLookup nobody = [](uid_t) { return std::optional<UserAccount>(); };
    EXPECT_EQ(performAs(::geteuid() + 1, nobody, nothing), EPERM);
}

TEST(UserRights, TheAccountOfThisUserIsInTheDatabase) {
    const auto account = systemAccount(0);
    ASSERT_TRUE(account);
    EXPECT_EQ(account->user, 0u);
    EXPECT_TRUE(account->home.starts_with('/'));
    EXPECT_FALSE(account->groups.empty());
    EXPECT_FALSE(systemAccount(54321));
}

}  // namespace
}  // namespace lumacast
