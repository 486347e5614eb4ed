// Disks that are full, slow, silent or gone; processes that are killed; the end of the daemon.

#include <gtest/gtest.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <future>
#include <random>

#include "tests/unit/linux_media/FaultyFiles.h"
#include "tests/unit/linux_media/RecordedMovie.h"
#include "tests/unit/linux_media/Times.h"

namespace lumacast::testing {
namespace {

struct FaultyMovie {
    std::shared_ptr<FaultyFiles> disk = std::make_shared<FaultyFiles>();
    RecordedMovie movie{128, 96, 2'000'000, disk};
};

TEST(Disk, HasTheFileForThisUserAlone) {
    const mode_t before = ::umask(0);
    RecordedMovie movie;
    ::umask(before);
    struct stat information {};
    ASSERT_EQ(::stat(movie.path().c_str(), &information), 0);
    EXPECT_EQ(information.st_mode & 0777, 0600u);
}

TEST(Disk, PathsThatClimbAreRefused) {
    HandClock clock;
    ScratchDirectory directory;
    LinuxContainerWriters writers(clock);
    const auto made = writers.make(URL::file(directory.path("../climbed.mp4")), ContainerType::Mpeg4);
    ASSERT_TRUE(std::holds_alternative<Error>(made));
    EXPECT_FALSE(std::filesystem::exists(directory.path("../climbed.mp4")));
}

TEST(Disk, NothingIsMadeButInTheDirectoryItself) {
    namespace fs = std::filesystem;
    ScratchDirectory own;
    const fs::path directory = own.path("movies"), outside = own.path("outside");
    fs::create_directory(directory);
    fs::create_directory(outside);
    fs::create_directory_symlink(outside, directory / "App");
    media::PosixMovieFiles files(directory.string());
    const auto error = [&](const std::string& path) {
        const auto made = files.create(path);
        return std::holds_alternative<int>(made) ? std::get<int>(made) : 0;
    };
    EXPECT_EQ(error(directory.string() + "//App/Two.mp4"), EACCES) << "a name with a slash";
    EXPECT_EQ(error(outside.string() + "/App.mp4"), EACCES);
    EXPECT_EQ(error(directory.string() + "/../outside/App.mp4"), EINVAL);
    EXPECT_EQ(error(directory.string() + "/" + std::string(252, 'n') + ".mp4"), ENAMETOOLONG);
    EXPECT_EQ(error(directory.string() + "/" + std::string(251, 'n') + ".mp4"), 0);
    EXPECT_TRUE(fs::is_empty(outside));
    if (::geteuid() != 0) return;  // only the administrator can plant something in somebody else's name
    fs::remove_all(directory);
    fs::create_directory_symlink(outside, directory);
    EXPECT_EQ(error(directory.string() + "/App.mp4"), 0) << "a link of its own";
    fs::remove(outside / "App.mp4");
    ASSERT_EQ(::lchown(directory.c_str(), 65534, 65534), 0);
    EXPECT_EQ(error(directory.string() + "/App.mp4"), EACCES);
    EXPECT_TRUE(fs::is_empty(outside));
}

TEST(Disk, ThatIsFullFailsTheMovieWithItsError) {
    FaultyMovie faulty;
    RecordedMovie& movie = faulty.movie;
    faulty.disk->failAfter(2000, ENOSPC);
    movie.start();
    std::int64_t at = 0;
    EXPECT_TRUE(eventually([&] {
        movie.video->append(greyPicture(128, 96, static_cast<std::uint64_t>(at), static_cast<std::uint8_t>(at * 37),
                                        atNanoseconds(at * 100 * kMillisecond)));
        ++at;
        return movie.writer->status() == ContainerStatus::Failed;
    }));
    ASSERT_TRUE(movie.writer->error());
    EXPECT_EQ(movie.writer->error()->domain(), kSystemErrorDomain);
    EXPECT_EQ(movie.writer->error()->code(), ENOSPC);
    EXPECT_FALSE(movie.appendGrey(100, 3600 * kSecond));
    EXPECT_EQ(movie.finish(), ContainerStatus::Failed);
    EXPECT_EQ(movie.writer->error()->code(), ENOSPC) << "the first error stays";
}

/// The same failure at every write in turn: the movie fails, and what was written plays or has nothing to play yet.
TEST(Disk, MayFailAtAnyWriteAndWhatWasWrittenStillPlays) {
    std::uint64_t whole = 0;
    for (std::uint64_t bytes = 0; whole == 0 || bytes < whole; bytes += 211) {
        FaultyMovie faulty;
        RecordedMovie& movie = faulty.movie;
        if (whole != 0) faulty.disk->failAfter(bytes, EIO);
        movie.start();
        for (int i = 0; i < 6; ++i) movie.appendGrey(20 + i * 30, i * 500 * kMillisecond);
        const ContainerStatus status = movie.finish();
        if (whole == 0) {
            ASSERT_EQ(status, ContainerStatus::Completed);
            whole = movie.writer->bytesWritten();
            continue;
        }
        EXPECT_EQ(status, ContainerStatus::Failed) << bytes;
        ASSERT_TRUE(movie.writer->error());
        EXPECT_EQ(movie.writer->error()->code(), EIO);
        checkers::MovieReader reader(movie.path());
        if (!reader.error().empty()) continue;
        EXPECT_TRUE(reader.readPictures([](const auto&) {})) << bytes << ": " << reader.error();
    }
}

TEST(Disk, ThatCannotSyncFailsTheMovie) {
    FaultyMovie faulty;
    faulty.disk->failSync(EIO);
    faulty.movie.start();
    ASSERT_TRUE(faulty.movie.appendGrey(100, 0));
    EXPECT_EQ(faulty.movie.finish(), ContainerStatus::Failed);
    EXPECT_EQ(faulty.movie.writer->error()->code(), EIO);
}

TEST(Disk, ThatDoesNotAnswerIsNotWaitedFor) {
    FaultyMovie faulty;
    RecordedMovie& movie = faulty.movie;
    movie.start();
    faulty.disk->freeze();
    double longest = 0;
    for (int i = 0; i < 200; ++i) {
        longest = std::max(longest, secondsTaken([&] {
            movie.video->isReadyForMoreMediaData();
            movie.video->append(
                greyPicture(128, 96, static_cast<std::uint64_t>(i), 100, atNanoseconds(i * 20 * kMillisecond)));
        }));
    }
    Happening done;
    longest = std::max(longest, secondsTaken([&] { movie.writer->finishWriting([&] { done.happen(); }); }));
    EXPECT_LT(longest, 0.5);
    EXPECT_EQ(done.count(), 0);
    faulty.disk->thaw();
    EXPECT_TRUE(done.waitFor());
    EXPECT_EQ(movie.writer->status(), ContainerStatus::Completed);
}

TEST(Disk, ThatCreatesLateIsWaitedForFortyMilliseconds) {
    HandClock clock;
    clock.startCaptureClock();
    ScratchDirectory directory;
    const auto disk = std::make_shared<FaultyFiles>();
    LinuxContainerWriters writers(clock, disk);
    disk->freeze();
    std::unique_ptr<ContainerWriter> writer;
    const double seconds = secondsTaken([&] {
        auto made = writers.make(URL::file(directory.path("late.mp4")), ContainerType::Mpeg4);
        ASSERT_TRUE(std::get_if<0>(&made)) << "a silent disk is no error yet";
        writer = std::move(std::get<0>(made));
    });
    EXPECT_GE(seconds, 0.039);
    EXPECT_LT(seconds, 0.5);
    const auto input = writer->addVideoInput(videoSettings(128, 96));
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(atNanoseconds(0));
    EXPECT_TRUE(input->append(greyPicture(128, 96, 1, 100, atNanoseconds(0))));
    disk->thaw();
    Happening done;
    writer->finishWriting([&] { done.happen(); });
    ASSERT_TRUE(done.waitFor());
    EXPECT_EQ(writer->status(), ContainerStatus::Completed);
    EXPECT_EQ(shownPictures(directory.path("late.mp4")).size(), 1u);
}

TEST(Disk, ThatRefusesLateFailsTheWriter) {
    HandClock clock;
    ScratchDirectory directory;
    const auto disk = std::make_shared<FaultyFiles>();
    LinuxContainerWriters writers(clock, disk);
    disk->freeze();
    disk->failCreation(EACCES);
    auto made = writers.make(URL::file(directory.path("late.mp4")), ContainerType::Mpeg4);
    auto* const writer = std::get_if<0>(&made);
    ASSERT_TRUE(writer);
    disk->thaw();
    EXPECT_TRUE(eventually([&] { return (*writer)->status() == ContainerStatus::Failed; }));
    EXPECT_EQ((*writer)->error()->code(), EACCES);
    EXPECT_FALSE((*writer)->startWriting());
}

TEST(Disk, IsBroughtUpToDateWithEveryFragment) {
    FaultyMovie faulty;
    faulty.movie.start();
    for (int i = 0; i < 20; ++i) ASSERT_TRUE(faulty.movie.appendGrey(i * 10, i * kSecond));
    ASSERT_EQ(faulty.movie.finish(), ContainerStatus::Completed);
    EXPECT_GE(faulty.disk->syncs(), 20) << "once a fragment, which is a second at most";
}

TEST(Disk, WorksOnTheFileItMadeEvenWhenItsNameIsTaken) {
    RecordedMovie movie;
    movie.start();
    ASSERT_TRUE(movie.appendGrey(100, 0));
    std::filesystem::rename(movie.path(), movie.path() + ".moved");
    std::ofstream(movie.path()) << "somebody else's";
    ASSERT_TRUE(movie.appendGrey(150, kSecond));
    ASSERT_EQ(movie.finish(), ContainerStatus::Completed);
    EXPECT_EQ(std::filesystem::file_size(movie.path()), 15u);
    EXPECT_EQ(shownPictures(movie.path() + ".moved").size(), 2u);
}

/// How many pictures a player shows of a file that is being written; it may have none to show yet.
std::size_t picturesSoFar(const std::string& path) {
    std::size_t count = 0;
    checkers::MovieReader reader(path);
    return reader.error().empty() && reader.readPictures([&](const auto&) { ++count; }) ? count : 0;
}

TEST(Disk, HasAPictureWithinASecondEvenWhenNoOtherComes) {
    RecordedMovie movie;
    movie.start();
    for (std::size_t number = 1; number <= 3; ++number) {  // stamps too near for fragments of their own by media time
        ASSERT_TRUE(movie.appendGrey(100, static_cast<std::int64_t>(number) * 10 * kMillisecond));
        const double seconds = secondsTaken([&] {
            EXPECT_TRUE(eventually([&] { return picturesSoFar(movie.path()) == number; }));
        });
        EXPECT_LT(seconds, 1.0);
    }
}

TEST(Daemon, ClosesItsOpenMoviesAtTheEnd) {
    HandClock clock;
    clock.startCaptureClock();
    ScratchDirectory directory;
    LinuxContainerWriters writers(clock);
    std::vector<std::unique_ptr<ContainerWriter>> open;
    for (const char* name : {"a.mp4", "b.mp4", "unused.mp4"}) {
        auto made = writers.make(URL::file(directory.path(name)), ContainerType::Mpeg4);
        ASSERT_TRUE(std::get_if<0>(&made));
        open.push_back(std::move(std::get<0>(made)));
    }
    for (int i = 0; i < 2; ++i) {
        const auto input = open[static_cast<std::size_t>(i)]->addVideoInput(videoSettings(128, 96));
        ASSERT_TRUE(open[static_cast<std::size_t>(i)]->startWriting());
        open[static_cast<std::size_t>(i)]->startSession(atNanoseconds(0));
        ASSERT_TRUE(input->append(greyPicture(128, 96, 1, 100, atNanoseconds(0))));
    }
    clock.captureClock()->run();
    clock.advance(std::chrono::seconds(3));
    const auto closed = writers.closeOpenMovies();
    EXPECT_EQ(open[0]->status(), ContainerStatus::Completed);
    EXPECT_EQ(open[2]->status(), ContainerStatus::Unknown);
    for (const char* name : {"a.mp4", "b.mp4"}) EXPECT_EQ(movieNanoseconds(directory.path(name)), 3 * kSecond);
    ASSERT_EQ(closed.size(), 2u) << "what was never begun is no recording";
    EXPECT_EQ(closed[1].path, directory.path("b.mp4"));
    EXPECT_EQ(closed[1].seconds, 3.0);
    EXPECT_EQ(closed[1].width, 128);
    EXPECT_EQ(closed[1].height, 96);
    EXPECT_EQ(closed[1].pictures, 1u);
    EXPECT_TRUE(writers.closeOpenMovies().empty()) << "they are at their ends";
    Happening done;
    open[0]->finishWriting([&] { done.happen(); });  // a lane that comes too late is still answered
    EXPECT_TRUE(done.waitFor());
}

TEST(Daemon, WaitsForADeadDiskOnlyForAWhileAtTheEnd) {
    FaultyMovie faulty;
    faulty.movie.start();
    ASSERT_TRUE(faulty.movie.appendGrey(100, 0));
    faulty.disk->freeze();
    const double seconds = secondsTaken([&] { faulty.movie.writers().closeOpenMovies(); });
    EXPECT_GE(seconds, 4.9);
    EXPECT_LT(seconds, 15.0);
    faulty.disk->thaw();
}

TEST(Daemon, AMovieWhoseEndWasAskedForBeforeIsWaitedForAndNotToldOf) {
    FaultyMovie faulty;
    faulty.movie.start();
    ASSERT_TRUE(faulty.movie.appendGrey(100, 0));
    faulty.disk->freeze();
    Happening done;
    faulty.movie.writer->finishWriting([&] { done.happen(); });
    auto closing = std::async(std::launch::async, [&] { return faulty.movie.writers().closeOpenMovies(); });
    EXPECT_EQ(closing.wait_for(std::chrono::milliseconds(300)), std::future_status::timeout) << "it is waited for";
    faulty.disk->thaw();
    EXPECT_TRUE(closing.get().empty());
    EXPECT_EQ(faulty.movie.writer->status(), ContainerStatus::Completed);
    EXPECT_TRUE(done.waitFor());
}

TEST(Daemon, ADiskThatIsSlowButWorksIsWaitedForAtTheEnd) {
    FaultyMovie faulty;
    faulty.movie.start();
    for (int i = 0; i < 3; ++i) ASSERT_TRUE(faulty.movie.appendGrey(i * 10, i * kSecond));
    faulty.disk->slowDown(std::chrono::milliseconds(400));
    const int before = faulty.disk->answers();
    const double seconds = secondsTaken([&] { faulty.movie.writers().closeOpenMovies(); });
    EXPECT_EQ(faulty.movie.writer->status(), ContainerStatus::Completed);
    const int answers = faulty.disk->answers() - before;
    std::printf("%d answers of the disk, %.1f s\n", answers, seconds);
    EXPECT_GT(seconds, 5.5) << "longer than one that does nothing";
    EXPECT_EQ(shownPictures(faulty.movie.path()).size(), 3u);
}

TEST(Daemon, SecuresItsOpenMoviesAndRecordsOn) {
    FaultyMovie faulty;
    faulty.movie.start();
    ASSERT_TRUE(faulty.movie.appendGrey(100, 0));
    ASSERT_TRUE(faulty.movie.appendGrey(120, 10 * kMillisecond));
    ASSERT_TRUE(faulty.movie.writers().secureOpenMovies(std::chrono::seconds(30)));
    EXPECT_EQ(picturesSoFar(faulty.movie.path()), 2u) << "it is there when the answer is";
    const int syncs = faulty.disk->syncs();
    EXPECT_GE(syncs, 1);
    EXPECT_TRUE(faulty.movie.writers().secureOpenMovies(std::chrono::seconds(30))) << "with nothing new";
    ASSERT_TRUE(faulty.movie.appendGrey(140, 20 * kMillisecond));
    ASSERT_TRUE(faulty.movie.writers().secureOpenMovies(std::chrono::seconds(30)));
    EXPECT_GT(faulty.disk->syncs(), syncs);
    EXPECT_EQ(picturesSoFar(faulty.movie.path()), 3u);
    ASSERT_EQ(faulty.movie.finish(), ContainerStatus::Completed);
    EXPECT_EQ(shownPictures(faulty.movie.path()).size(), 3u);
    EXPECT_TRUE(faulty.movie.writers().secureOpenMovies(std::chrono::seconds(30))) << "nothing is open";
}

TEST(Daemon, SecuringWaitsForADeadDiskOnlyAsLongAsItMay) {
    FaultyMovie faulty;
    faulty.movie.start();
    ASSERT_TRUE(faulty.movie.appendGrey(100, 0));
    faulty.disk->freeze();
    EXPECT_FALSE(faulty.movie.writers().secureOpenMovies(std::chrono::milliseconds(50)));
    faulty.disk->thaw();
    EXPECT_TRUE(faulty.movie.writers().secureOpenMovies(std::chrono::seconds(30)));
    EXPECT_EQ(faulty.movie.finish(), ContainerStatus::Completed);
}

/// What the child of the next test does: records pictures in real time at `rate`, the luma telling the number, and
/// tells through the pipe when each was appended.
[[noreturn]] void recordForEver(const std::string& path, int pipe, int rate) {
    HandClock clock;
    clock.startCaptureClock();
    LinuxContainerWriters writers(clock);
    auto made = writers.make(URL::file(path), ContainerType::Mpeg4);
    if (!std::get_if<0>(&made)) ::_exit(1);
    auto& writer = *std::get<0>(made);
    const auto input = writer.addVideoInput(videoSettings(320, 240));
    if (!writer.startWriting()) ::_exit(2);
    writer.startSession(atNanoseconds(0));
    const auto begin = std::chrono::steady_clock::now();
    for (std::int64_t i = 0;; ++i) {
        const std::int64_t stamp = i * kSecond / rate;
        std::this_thread::sleep_until(begin + std::chrono::nanoseconds(stamp));
        if (!input->append(greyPicture(320, 240, static_cast<std::uint64_t>(i), static_cast<std::uint8_t>(i % 200 + 20),
                                       atNanoseconds(stamp)))) {
            continue;  // no room: a picture lost
        }
        if (::write(pipe, &stamp, sizeof stamp) != sizeof stamp) ::_exit(3);
    }
}

class Killed : public ::testing::TestWithParam<int> {};

TEST_P(Killed, AMoviePlaysUpToItsLastSecond) {
    const int rate = GetParam();
    std::mt19937 random(static_cast<unsigned>(rate));
    for (int round = 0; round < 10; ++round) {
        ScratchDirectory directory;
        const std::string path = directory.path("movie.mp4");
        int ends[2];
        ASSERT_EQ(::pipe(ends), 0);
        const pid_t child = ::fork();
        ASSERT_GE(child, 0);
        if (child == 0) {
            ::close(ends[0]);
            recordForEver(path, ends[1], rate);
        }
        ::close(ends[1]);
        const std::int64_t moment = 1500 * kMillisecond + random() % 1'500'000'000;
        const auto killing = std::chrono::steady_clock::now() + std::chrono::nanoseconds(moment);
        std::int64_t last = -1;
        std::int64_t stamp = 0;
        ::fcntl(ends[0], F_SETFL, O_NONBLOCK);
        for (auto now = std::chrono::steady_clock::now(); now < killing; now = std::chrono::steady_clock::now()) {
            pollfd reported{ends[0], POLLIN, 0};
            const auto left = std::chrono::ceil<std::chrono::milliseconds>(killing - now);
            if (::poll(&reported, 1, static_cast<int>(left.count())) > 0)
                (void)!::read(ends[0], &stamp, sizeof stamp);
        }
        ::kill(child, SIGKILL);
        int status = 0;
        ASSERT_EQ(::waitpid(child, &status, 0), child);
        ASSERT_TRUE(WIFSIGNALED(status)) << "the child ended by itself";
        last = stamp;
        while (::read(ends[0], &stamp, sizeof stamp) == sizeof stamp) last = stamp;
        ::close(ends[0]);

        const auto shown = shownPictures(path);
        ASSERT_FALSE(shown.empty());
        EXPECT_GE(shown.back().nanoseconds, last - kSecond) << "killed after " << moment << ", last picture " << last;
    }
}
INSTANTIATE_TEST_SUITE_P(Rates, Killed, ::testing::Values(1, 60));

}  // namespace
}  // namespace lumacast::testing
