#include "linux/media/UnfinishedMovies.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <mutex>

#include "linux/media/MovieFile.h"
#include "linux/media/mp4/MovieLook.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/contract/SmallDisk.h"
#include "tests/unit/linux_mp4/Descriptions.h"

namespace lumacast {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using mp4::MovieError;

std::string recording(mp4::MoviePurpose purpose = mp4::MoviePurpose::recording, bool isFinished = false) {
    mp4::test::MemorySink sink;
    mp4::MovieOptions options;
    options.purpose = purpose;
    mp4::MovieBoxWriter writer(sink, options);
    const auto video = writer.addVideoTrack(mp4::test::videoDescription());
    EXPECT_EQ(writer.start(), MovieError::none);
    for (std::uint32_t i = 0; i < 100; ++i)
        EXPECT_EQ(writer.addSample(*video, {i * 40'000, 0, i % 25 == 0}, mp4::test::payload(i, 500)), MovieError::none);
    EXPECT_EQ(writer.flushFragment(), MovieError::none);
    if (isFinished) {
        EXPECT_EQ(writer.finish(4'000'000), MovieError::none);
    }
    return {sink.file().begin(), sink.file().end()};
}

class UnfinishedMovies : public ::testing::Test {
protected:
    /// What a start of the daemon does, to its end.
    void start() {
        media::UnfinishedMovies movies(scratch.path(), log);
        movies.remember();
        if (meanwhile) meanwhile();
        movies.begin();
        movies.wait();
    }
    mp4::MovieLook look(const std::string& name) const {
        const auto folder = media::MovieFolder::open(scratch.path());
        const auto movie = folder ? folder->openToLook(name) : nullptr;
        return movie ? mp4::lookAtMovie(*movie) : mp4::MovieLook();
    }
    struct stat statusOf(const std::string& name) const {
        struct stat status = {};
        EXPECT_EQ(::lstat(scratch.path(name).c_str(), &status), 0) << name;
        return status;
    }
    void expectUntouched(const std::string& name, const std::string& text) const {
        EXPECT_TRUE(ScratchDirectory::read(scratch.path(name)) == text) << name;
    }

    ScratchDirectory scratch;
    std::mutex mutex;
    std::vector<std::string> lines;
    std::vector<std::string> errors;
    Log log{[this](LogLevel level, std::string_view text) {
        const std::lock_guard lock(mutex);
        (level == LogLevel::Error ? errors : lines).emplace_back(text);
    }};
    std::function<void()> meanwhile;
};

TEST_F(UnfinishedMovies, AreRecoveredKeepTheirDatesAndAreToldOnce) {
    scratch.write("Player.mp4", recording());
    scratch.write("Other.mp4", recording());
    const struct timespec times[] = {{1'700'000'000, 5}, {1'700'000'111, 123'456'789}};
    ASSERT_EQ(::utimensat(AT_FDCWD, scratch.path("Player.mp4").c_str(), times, 0), 0);
    start();
    EXPECT_EQ(nameOf(look("Player.mp4").state), "recovered");
    EXPECT_EQ(look("Player.mp4").nanoseconds.value_or(0) / 1'000'000, 3960);
    EXPECT_EQ(nameOf(look("Other.mp4").state), "recovered");
    EXPECT_EQ(statusOf("Player.mp4").st_mtim.tv_sec, 1'700'000'111);
    EXPECT_EQ(statusOf("Player.mp4").st_mtim.tv_nsec, 123'456'789);
    EXPECT_THAT(lines, ::testing::UnorderedElementsAre(
                           "an earlier run left Player.mp4 unfinished: it has its index now",
                           "an earlier run left Other.mp4 unfinished: it has its index now"));
    EXPECT_THAT(errors, IsEmpty());
    lines.clear();
    const std::string after = ScratchDirectory::read(scratch.path("Player.mp4"));
    start();
    EXPECT_THAT(lines, IsEmpty());
    expectUntouched("Player.mp4", after);
}

TEST_F(UnfinishedMovies, OnlyWhatIsOneIsTouched) {
    const std::string whole = recording(mp4::MoviePurpose::recording, true), part = recording();
    scratch.write("finished.mp4", whole);
    scratch.write("text.mp4", "not a movie");
    scratch.write("empty.mp4", "");
    scratch.write("start.mp4", part.substr(0, 60));
    scratch.write("folder/inside.mp4", part);
    const ScratchDirectory elsewhere;
    elsewhere.write("aim.mp4", part);
    ASSERT_EQ(::symlink(elsewhere.path("aim.mp4").c_str(), scratch.path("link.mp4").c_str()), 0);
    ASSERT_EQ(::mkfifo(scratch.path("pipe.mp4").c_str(), 0600), 0);
    start();
    expectUntouched("finished.mp4", whole);
    expectUntouched("text.mp4", "not a movie");
    expectUntouched("empty.mp4", "");
    expectUntouched("start.mp4", part.substr(0, 60));
    expectUntouched("folder/inside.mp4", part);
    EXPECT_TRUE(ScratchDirectory::read(elsewhere.path("aim.mp4")) == part);
    EXPECT_THAT(lines, IsEmpty());
    EXPECT_THAT(errors, IsEmpty());
}

TEST_F(UnfinishedMovies, ThatAreCopiesAreRemovedAndFinishedCopiesStay) {
    scratch.write("Player_trimmed.mp4", recording(mp4::MoviePurpose::copy));
    const std::string whole = recording(mp4::MoviePurpose::copy, true);
    scratch.write("LCLuma_Final1.mp4", whole);
    start();
    EXPECT_NE(::access(scratch.path("Player_trimmed.mp4").c_str(), F_OK), 0);
    expectUntouched("LCLuma_Final1.mp4", whole);
    EXPECT_THAT(lines, ElementsAre("an earlier run left the copy Player_trimmed.mp4 unfinished: removed"));
}

// A recording's file is marked from the moment it is made, by whichever process.
TEST_F(UnfinishedMovies, ThatAreBeingWrittenAreNotTouched) {
    const std::string part = recording(), copy = recording(mp4::MoviePurpose::copy);
    std::vector<std::unique_ptr<media::MovieFile>> writing;
    for (const auto& [name, text] : {std::pair("movie.mp4", part), std::pair("copy.mp4", copy)}) {
        auto made = media::PosixMovieFiles(scratch.path()).create(scratch.path(name));
        ASSERT_TRUE(std::holds_alternative<std::unique_ptr<media::MovieFile>>(made));
        writing.push_back(std::move(std::get<0>(made)));
        const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
        ASSERT_EQ(writing.back()->write(0, {bytes, text.size()}), 0);
    }
    start();
    expectUntouched("movie.mp4", part);
    expectUntouched("copy.mp4", copy);
    EXPECT_THAT(lines, IsEmpty());
    writing.clear();
    start();
    EXPECT_EQ(nameOf(look("movie.mp4").state), "recovered");
    EXPECT_NE(::access(scratch.path("copy.mp4").c_str(), F_OK), 0);
}

TEST_F(UnfinishedMovies, ThatAreGoneOrOthersByThenAreNoError) {
    const std::string part = recording(), copy = recording(mp4::MoviePurpose::copy);
    scratch.write("gone.mp4", part);
    scratch.write("replaced.mp4", part);
    scratch.write("replaced copy.mp4", copy);
    scratch.write("changed.mp4", part);
    meanwhile = [&] {
        ASSERT_EQ(::unlink(scratch.path("gone.mp4").c_str()), 0);
        for (const auto& [name, text] : {std::pair("replaced.mp4", part), std::pair("replaced copy.mp4", copy)}) {
            ASSERT_EQ(::rename(scratch.write("new", text).c_str(), scratch.path(name).c_str()), 0);
        }
        // By the owner's hand; the file system's own clock goes on with it.
        const struct timespec before = statusOf("changed.mp4").st_ctim;
        struct timespec after = before;
        while (after.tv_sec == before.tv_sec && after.tv_nsec == before.tv_nsec) {
            ASSERT_EQ(::chmod(scratch.path("changed.mp4").c_str(), 0600), 0);
            after = statusOf("changed.mp4").st_ctim;
        }
        scratch.write("younger.mp4", part);
    };
    start();
    for (const char* name : {"replaced.mp4", "changed.mp4", "younger.mp4"}) expectUntouched(name, part);
    expectUntouched("replaced copy.mp4", copy);
    EXPECT_NE(::access(scratch.path("gone.mp4").c_str(), F_OK), 0);
    EXPECT_THAT(lines, IsEmpty());
    EXPECT_THAT(errors, IsEmpty());
}

TEST_F(UnfinishedMovies, StayAsTheyAreOnAFullDiskWhichIsSaidOnce) {
    const std::string part = recording();
    for (const char* name : {"a.mp4", "b.mp4", "c.mp4"}) scratch.write(name, part);
    const struct stat before = statusOf("a.mp4");
    {
        const SmallFilesOnly full(part.size() + 100);
        start();
    }
    for (const char* name : {"a.mp4", "b.mp4", "c.mp4"}) expectUntouched(name, part);
    EXPECT_EQ(statusOf("a.mp4").st_mtim.tv_nsec, before.st_mtim.tv_nsec);
    EXPECT_THAT(lines, IsEmpty());
    EXPECT_THAT(errors, ElementsAre(HasSubstr(" unfinished, and its index can't be written: ")));
    start();
    for (const char* name : {"a.mp4", "b.mp4", "c.mp4"}) EXPECT_EQ(nameOf(look(name).state), "recovered");
}

// A broadcast whose extension takes nothing leaves a clip every few seconds.
TEST_F(UnfinishedMovies, AreFoundAmongMoreFilesThanAreLookedAt) {
    constexpr int kCut = 20;
    for (std::size_t i = 0; i < 2 * media::UnfinishedMovies::kMostFiles; ++i)
        scratch.write("LCMovie_" + std::to_string(i) + ".mp4", "");
    const std::string part = recording();
    for (int i = 0; i < kCut; ++i) scratch.write("cut" + std::to_string(i) + ".mp4", part);
    start();
    for (int i = 0; i < kCut; ++i) EXPECT_EQ(nameOf(look("cut" + std::to_string(i) + ".mp4").state), "recovered") << i;
}

TEST_F(UnfinishedMovies, ThatCanNotBeReadBackAreNamed) {
    std::string damaged = recording();
    const std::size_t second = damaged.find("moof", damaged.find("moof") + 1);
    damaged[second + 20] ^= 0x55;
    scratch.write("damaged.mp4", damaged);
    start();
    expectUntouched("damaged.mp4", damaged);
    EXPECT_THAT(errors, ElementsAre("an earlier run left damaged.mp4 unfinished, and it can't be read back: damaged"));
}

TEST_F(UnfinishedMovies, AreNotLookedForInAFolderThatIsNotThere) {
    media::UnfinishedMovies movies(scratch.path("nowhere"), log);
    movies.remember();
    bool wasCalled = false;
    movies.begin([&] { wasCalled = true; });
    movies.wait();
    EXPECT_TRUE(wasCalled);
    EXPECT_THAT(errors, IsEmpty());
}

}  // namespace
}  // namespace lumacast
