// What a movie costs once it is over while somebody still holds its writer: nothing but memory.

#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <string>

#include "tests/unit/linux_media/FaultyFiles.h"
#include "tests/unit/linux_media/RecordedMovie.h"
#include "tests/unit/linux_media/Times.h"

namespace lumacast::testing {
namespace {

namespace fs = std::filesystem;

/// Descriptors this process has of the file that is, or was, at `path`.
std::size_t descriptorsOf(const std::string& path) {
    std::size_t count = 0;
    std::error_code gone;
    for (const auto& entry : fs::directory_iterator("/proc/self/fd")) {
        const std::string target = fs::read_symlink(entry.path(), gone).string();  // "... (deleted)" once unlinked
        if (!gone && target.starts_with(fs::weakly_canonical(path).string())) count += 1;
    }
    return count;
}

std::size_t threads() {
    const fs::directory_iterator begin("/proc/self/task");
    return static_cast<std::size_t>(std::distance(begin, fs::directory_iterator()));
}

/// A writer whose makers have what they always have; the threads of its movie come and go.
struct Held {
    explicit Held(std::shared_ptr<media::MovieFiles> files = std::make_shared<media::PosixMovieFiles>())
        : writers(clock, std::move(files)), threadsBefore(threads()) {
        clock.startCaptureClock();
        auto made = writers.make(URL::file(path), ContainerType::Mpeg4);
        EXPECT_TRUE(std::get_if<0>(&made));
        writer = std::move(std::get<0>(made));
        input = writer->addVideoInput(videoSettings(128, 96));
        EXPECT_EQ(descriptorsOf(path), 1u);
        EXPECT_GT(threads(), threadsBefore);
    }
    void start() {
        ASSERT_TRUE(writer->startWriting());
        writer->startSession(atNanoseconds(0));
    }
    bool append(std::int64_t nanoseconds) {
        return input->append(greyPicture(128, 96, ++number, 100, atNanoseconds(nanoseconds)));
    }
    void finish() {
        Happening done;
        writer->finishWriting([&] { done.happen(); });
        EXPECT_TRUE(done.waitFor());
        EXPECT_NE(done.thread(), std::this_thread::get_id());
    }
    void expectNothingIsLeft() {
        EXPECT_TRUE(eventually([&] { return descriptorsOf(path) == 0; })) << "the file is still open";
        EXPECT_TRUE(eventually([&] { return threads() == threadsBefore; }))
            << threads() << " threads, " << threadsBefore << " before";
        EXPECT_TRUE(eventually([&] { return !writers.bytesBeingWritten(path); }));
    }

    ScratchDirectory directory;
    const std::string path = directory.path("movie.mp4");
    HandClock clock;
    LinuxContainerWriters writers;
    const std::size_t threadsBefore;
    std::unique_ptr<ContainerWriter> writer;
    std::shared_ptr<TrackInput> input;
    std::uint64_t number = 0;
};

TEST(HeldWriter, OfACompletedMovieHoldsNoFileAndNoThread) {
    Held held;
    held.start();
    ASSERT_TRUE(held.append(0));
    EXPECT_TRUE(eventually([&] { return held.writer->bytesWritten() > 0; }));
    EXPECT_EQ(held.writers.bytesBeingWritten(held.path), held.writer->bytesWritten());
    held.finish();
    fs::remove(held.path);
    held.expectNothingIsLeft();

    EXPECT_EQ(held.writer->status(), ContainerStatus::Completed);
    EXPECT_FALSE(held.writer->error());
    EXPECT_EQ(held.writer->outputURL(), URL::file(held.path));
    EXPECT_GT(held.writer->bytesWritten(), 0u);
    EXPECT_EQ(held.writer->picturesTaken(), 1u);
    EXPECT_FALSE(held.append(kSecond));
    EXPECT_FALSE(held.writer->startWriting());
    held.finish();  // still told, once
    held.finish();
    EXPECT_EQ(held.writer->status(), ContainerStatus::Completed);
    EXPECT_FALSE(fs::exists(held.path)) << "never made again";
    held.expectNothingIsLeft();
}

TEST(HeldWriter, LeavesAWholeMovieWhenItsFileIsClosed) {
    Held held;
    held.start();
    for (std::int64_t i = 0; i < 3; ++i) {
        EXPECT_TRUE(eventually([&] { return held.input->isReadyForMoreMediaData(); }));
        ASSERT_TRUE(held.append(i * kSecond));
    }
    held.finish();
    held.expectNothingIsLeft();
    EXPECT_EQ(held.writer->bytesWritten(), fs::file_size(held.path));
    EXPECT_EQ(shownPictures(held.path).size(), 3u);
}

TEST(HeldWriter, OfAMovieWhoseDiskFailedHoldsNothingEvenBeforeItIsFinished) {
    const auto disk = std::make_shared<FaultyFiles>();
    Held held(disk);
    disk->failAfter(0, ENOSPC);
    held.start();
    EXPECT_TRUE(eventually([&] { return held.writer->status() == ContainerStatus::Failed; }));
    held.expectNothingIsLeft();
    EXPECT_FALSE(held.append(0));
    held.finish();
    ASSERT_TRUE(held.writer->error());
    EXPECT_EQ(held.writer->error()->code(), ENOSPC);
}

TEST(HeldWriter, OfAMovieThatWasNeverStartedHoldsNothingOnceItIsFinished) {
    Held held;
    held.finish();
    EXPECT_EQ(held.writer->status(), ContainerStatus::Failed);
    held.expectNothingIsLeft();
    EXPECT_TRUE(fs::exists(held.path));
    EXPECT_EQ(held.writer->error()->code(), ENODATA);
}

TEST(HeldWriter, ClosedAtTheEndOfTheProcessHoldsNothing) {
    Held held;
    held.start();
    ASSERT_TRUE(held.append(0));
    held.writers.closeOpenMovies();
    EXPECT_EQ(held.writer->status(), ContainerStatus::Completed);
    held.expectNothingIsLeft();
}

/// The file is closed though the one who is told never comes back from it.
TEST(HeldWriter, ClosesTheFileBeforeWhoeverIsToldIsDone) {
    Held held;
    held.start();
    ASSERT_TRUE(held.append(0));
    Happening told, seen;
    held.writer->finishWriting([&] {
        told.happen();
        EXPECT_TRUE(seen.waitFor());
    });
    ASSERT_TRUE(told.waitFor());
    EXPECT_TRUE(eventually([&] { return descriptorsOf(held.path) == 0; }));
    seen.happen();
    held.expectNothingIsLeft();
}

TEST(HeldWriter, LetGoOfUnfinishedLeavesAFileThatPlays) {
    Held held;
    held.start();
    ASSERT_TRUE(held.append(0));
    held.writer.reset();
    held.expectNothingIsLeft();
    EXPECT_EQ(shownPictures(held.path).size(), 1u);
}

}  // namespace
}  // namespace lumacast::testing
