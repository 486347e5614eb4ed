#include "linux/library/StaleParts.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "linux/library/LinuxPhotoLibrary.h"
#include "linux/library/NewFile.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast {
namespace {

constexpr char kPart[] = ".lumacast-0123456789abcdef.part";
constexpr timespec kNever = {4'000'000'000, 0};

class StaleParts : public ::testing::Test {
protected:
    std::size_t remove(const timespec& before = kNever) const {
        const Fd folder(::open(scratch.path().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
        return removeStaleParts(folder.get(), before);
    }
    bool isThere(const std::string& name) const { return ::faccessat(AT_FDCWD, scratch.path(name).c_str(), F_OK, AT_SYMLINK_NOFOLLOW) == 0; }

    ScratchDirectory scratch;
};

TEST_F(StaleParts, OfSavesThatNobodyEndsAnyMoreGo) {
    scratch.write(kPart, "part of a movie");
    scratch.write("Recording 2026-11-21 14-05-59.mp4", "a movie");
    EXPECT_EQ(remove(), 1u);
    EXPECT_FALSE(isThere(kPart));
    EXPECT_TRUE(isThere("Recording 2026-11-21 14-05-59.mp4"));
    EXPECT_EQ(remove(), 0u);
}

TEST_F(StaleParts, AreKnownByTheirNameAndTheirKind) {
    const std::vector<std::string> others{".lumacast-0123456789abcde.part", ".lumacast-0123456789ABCDEF.part",
                                          ".lumacast-0123456789abcdef.mp4", "lumacast-0123456789abcdef.part",
                                          ".lumacast-.part",                ".lumacast-0123456789abcdef0.part"};
    for (const auto& name : others) scratch.write(name, "x");
    scratch.makeDirectory(".lumacast-00000000000000aa.part");
    scratch.write("aim", "x");
    ASSERT_EQ(::symlink("aim", scratch.path(".lumacast-00000000000000bb.part").c_str()), 0);
    ASSERT_EQ(::mkfifo(scratch.path(".lumacast-00000000000000cc.part").c_str(), 0600), 0);
    EXPECT_EQ(remove(), 0u);
    for (const auto& name : others) EXPECT_TRUE(isThere(name)) << name;
    for (const char* name : {".lumacast-00000000000000aa.part", ".lumacast-00000000000000bb.part",
                             ".lumacast-00000000000000cc.part", "aim"})
        EXPECT_TRUE(isThere(name)) << name;
}

TEST_F(StaleParts, OfASaveThatGoesOnStay) {
    const Fd folder(::open(scratch.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    auto made = NewFile::in(folder.get(), Unseen::HiddenName);
    ASSERT_TRUE(std::holds_alternative<NewFile>(made));
    ASSERT_EQ(::write(std::get<NewFile>(made).get(), "x", 1), 1);
    EXPECT_EQ(remove(), 0u);
    EXPECT_EQ(std::get<NewFile>(made).giveName("saved.mp4"), 0);
    EXPECT_TRUE(isThere("saved.mp4"));
}

TEST_F(StaleParts, YoungerThanTheQuestionStay) {
    scratch.write(kPart, "x");
    EXPECT_EQ(remove({1'000'000'000, 0}), 0u);
    EXPECT_TRUE(isThere(kPart));
}

TEST_F(StaleParts, AreRemovedFromTheUsersLibraryWhichIsNotMadeForIt) {
    LinuxPhotoLibrary::Options options;
    options.home = scratch.makeDirectory("home");
    options.configHome = scratch.path("home/.config");
    LinuxPhotoLibrary(options).removeUnfinished();
    EXPECT_FALSE(isThere("home/Videos"));
    const std::string part = scratch.write(std::string("home/Videos/Lumacast/") + kPart, "x");
    struct stat status = {};
    ASSERT_EQ(::stat(part.c_str(), &status), 0);
    // A library is made with the daemon: until the clock that stamps files has gone on, what is there may be its own.
    timespec now = {};
    do ::clock_gettime(CLOCK_REALTIME_COARSE, &now);
    while (now.tv_sec == status.st_ctim.tv_sec && now.tv_nsec <= status.st_ctim.tv_nsec);
    LinuxPhotoLibrary(options).removeUnfinished();
    EXPECT_FALSE(isThere(std::string("home/Videos/Lumacast/") + kPart));
}

}  // namespace
}  // namespace lumacast
