// Finished movies saved to the user's library by the real daemon, asked over its sockets.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <set>
#include <thread>

#include "tests/checkers/ToneChecker.h"
#include "tests/checkers/check_movie/MovieCheck.h"
#include "tests/checkers/tests/FileBytes.h"
#include "tests/client/Heard.h"
#include "tests/contract/SmallDisk.h"
#include "tests/system/SavingWorld.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using checkers::bytesOf;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

/// A user who owns nothing, and whose home is not there.
constexpr uid_t kNobody = 65534;

/// One picture track with every frame, one sound track with all of these tones and none of the others.
void expectMixed(const std::string& movie, const std::vector<double>& heard, const std::vector<double>& notHeard) {
    expectAllFrames(movie);
    checkers::MovieCheckOptions options;
    options.movie = movie;
    options.videoTracks = 1;
    options.audioTracks = 1;
    options.tones = heard;
    options.noTones = notHeard;
    for (const auto& finding : checkers::checkMovie(options).findings) ADD_FAILURE() << finding;
}

TEST(Saving, AMovieWithTwoSoundTracksHasBothInOneAfterwards) {
    SavingWorld world;
    world.startDaemon();
    const std::string movie = world.makeMovie("two.mp4", {440, 880});
    EXPECT_EQ(world.save(movie), 0) << world.daemonLog();
    const std::string saved = world.onlySaved();
    EXPECT_THAT(saved, HasSubstr("/videos/Lumacast/Recording 20"));
    expectMixed(saved, {440, 880}, {1500});
    EXPECT_TRUE(becomesGone(movie)) << "the library's is all there is";
    EXPECT_TRUE(waitUntil([&] { return world.temporaryFiles().empty(); }));
    EXPECT_EQ(world.countInLog(kNotMixed), 0u);
    EXPECT_EQ(world.countInLog("Video saved to camera roll successful"), 1u);
}

TEST(Saving, AMovieWithOneSoundTrackKeepsIt) {
    SavingWorld world;
    world.startDaemon();
    EXPECT_EQ(world.save(world.makeMovie("one.mp4", {440})), 0);
    expectMixed(world.onlySaved(), {440}, {880});
    EXPECT_EQ(world.countInLog(kNotMixed), 0u);
}

TEST(Saving, AMovieWithoutSoundStaysWithoutSound) {
    SavingWorld world;
    world.startDaemon();
    EXPECT_EQ(world.save(world.makeMovie("none.mp4", {})), 0);
    const std::string saved = world.onlySaved();
    expectAllFrames(saved);
    EXPECT_THAT(checkers::MovieReader(saved).audioTracks(), IsEmpty());
    EXPECT_EQ(world.countInLog(kNotMixed), 0u);
}

TEST(Saving, AMovieThatCantBeDecodedIsSavedAsItIs) {
    SavingWorld world;
    world.startDaemon();
    const std::string damaged = world.makeMovie("damaged.mp4", {440, 880});
    std::vector<char> bytes = bytesOf(damaged);
    for (std::size_t i = bytes.size() / 4; i < bytes.size() / 2; ++i) bytes[i] = static_cast<char>(i * 37);
    checkers::writeBytes(damaged, bytes);
    const std::string cutOff = world.path("movies/cut.mp4"), text = world.path("movies/text.mp4");
    checkers::writeBytes(cutOff, {bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(bytes.size() / 2)});
    std::ofstream(text) << "no movie at all";

    std::size_t failures = 0;
    for (const std::string& movie : {damaged, cutOff, text}) {
        SCOPED_TRACE(movie);
        const std::vector<char> before = bytesOf(movie);
        EXPECT_EQ(world.save(movie), 0);
        EXPECT_TRUE(bytesOf(world.onlySaved()) == before) << "not a byte is lost";
        EXPECT_EQ(world.countInLog(kNotMixed), ++failures);
        EXPECT_TRUE(becomesGone(movie));
        EXPECT_TRUE(waitUntil([&] { return world.temporaryFiles().empty(); }));
        fs::remove(world.onlySaved());
    }
}

TEST(Saving, AMovieThatIsNotThereFailsAndNothingIsRemoved) {
    SavingWorld world;
    world.startDaemon();
    const std::string other = world.makeMovie("other.mp4", {});
    std::ofstream(world.temporaryDirectory() + "/Other.mp4") << "x";
    EXPECT_EQ(world.save(world.path("movies/nothing.mp4")), kFailedToSave);
    EXPECT_EQ(world.save(world.moviePath()), kFailedToSave) << "nothing was recorded";
    EXPECT_THAT(world.library(), IsEmpty());
    EXPECT_TRUE(fs::exists(other));
    EXPECT_THAT(world.temporaryFiles(), ElementsAre("Other.mp4"));
}

TEST(Saving, TwoMoviesInTheSameSecondAreBothSaved) {
    // Both are mixed into a file named for the second. The library's disk does not answer, so that the first one's is
    // still there when the second is mixed: that one fails, and is saved as it is.
    SavingWorld world;
    std::vector<std::string> variables{"LC_DISK=" + world.path("videos")};
    for (const auto& variable : world.troubledDisk()) variables.push_back(variable);
    world.startDaemon(variables);
    const std::string first = world.makeMovie("first.mp4", {440, 880}), second = world.makeMovie("second.mp4", {660});
    const std::string copies = world.path("copies");
    fs::copy(world.path("movies"), copies);
    bool hasMet = false;
    for (int attempt = 0; attempt < 10 && !hasMet; ++attempt) {
        for (const char* name : {"first.mp4", "second.mp4"})
            fs::copy_file(copies + "/" + name, world.path("movies/") + name, fs::copy_options::skip_existing);
        const std::size_t failedBefore = world.countInLog(kNotMixed);
        world.setDiskStalled(true);
        Answers<std::optional<Error>> answers;
        world.recorder().save(URL::file(first), answers.handler(0));
        world.recorder().save(URL::file(second), answers.handler(1));
        const auto bothMixed = [&] {
            const auto states = world.saveStates();
            return states.size() >= 2 && states[states.size() - 1] == "adding" && states[states.size() - 2] == "adding";
        };
        ASSERT_TRUE(waitUntil(bothMixed, kPatience)) << world.daemonLog();
        EXPECT_EQ(answers.total(), 0);
        // What failed is logged a moment after the state has changed.
        EXPECT_TRUE(waitUntil([&] {
            hasMet = world.countInLog(kNotMixed) > failedBefore;
            return world.temporaryFiles().size() == (hasMet ? 1u : 2u);
        }));
        world.setDiskStalled(false);
        ASSERT_TRUE(waitUntil([&] { return answers.total() == 2; }, kPatience));
        EXPECT_TRUE(answers.eachOnce());
        EXPECT_FALSE(answers.last());
        EXPECT_TRUE(becomesGone(first));
        EXPECT_TRUE(becomesGone(second));
        EXPECT_TRUE(waitUntil([&] { return world.temporaryFiles().empty(); }));
        const auto saved = world.library();
        ASSERT_EQ(saved.size(), 2u);
        std::set<std::size_t> tracks;
        for (const std::string& movie : saved) {
            expectAllFrames(movie);
            const bool isFirst = checkers::MovieReader(movie).readSound(0).has_value() &&
                                 checkers::checkToneAbsent(*checkers::MovieReader(movie).readSound(0), 660, -60,
                                                           {std::chrono::milliseconds(100), std::chrono::seconds(1)})
                                     .empty();
            tracks.insert(isFirst ? 1 : 2);
        }
        EXPECT_THAT(tracks, ElementsAre(1, 2)) << "each of them once";
        for (const std::string& movie : saved) fs::remove(movie);
    }
    EXPECT_TRUE(hasMet) << "never in the same second";
}

TEST(Saving, AFullLibraryIsAnErrorAndLeavesNoHalfMovie) {
    SavingWorld world;
    constexpr std::size_t kRoom = 16 * 1024;
    const auto body = [&](const std::function<void()>& makeRoom) {
        const std::string movie = world.makeMovie("large.mp4", {440, 880});
        ASSERT_GT(fs::file_size(movie), 2 * kRoom);
        EXPECT_EQ(world.save(movie), kFailedToSave) << world.daemonLog();
        EXPECT_EQ(world.countInLog("Video saved to camera roll failed"), 1u);
        EXPECT_THAT(world.library(), IsEmpty());
        EXPECT_TRUE(becomesGone(movie)) << "deliberately: a save removes what it was given";
        EXPECT_TRUE(waitUntil([&] { return world.temporaryFiles().empty(); }));
        const auto saves = world.status()["saves"];
        EXPECT_EQ(saves[0]["state"], "failed");
        EXPECT_FALSE(saves[0]["error"].get<std::string>().empty());
        makeRoom();
        EXPECT_EQ(world.save(world.makeMovie("next.mp4", {440, 880})), 0) << world.daemonLog();
        expectMixed(world.onlySaved(), {440, 880}, {});
    };
    const bool isMounted = withSmallDisk(world.path("videos"), std::to_string(kRoom), [&] {
        world.startDaemon();
        body([&] {
            EXPECT_EQ(::mount("tmpfs", world.path("videos").c_str(), "tmpfs", MS_REMOUNT, "size=64m"), 0);
        });
        world.endDaemon(SIGTERM);
    });
    if (isMounted) return;
    // Where nothing may be mounted, the daemon's files can't grow.
    {
        const SmallFilesOnly small(kRoom);
        world.startDaemon();
    }
    body([&] {
        const rlimit wide{RLIM_INFINITY, RLIM_INFINITY};
        EXPECT_EQ(::prlimit(world.daemon().pid(), RLIMIT_FSIZE, &wide, nullptr), 0);
    });
}

TEST(Saving, AFullTemporaryDirectoryMeansThatAMovieIsSavedAsItIs) {
    SavingWorld world;
    world.startDaemon(world.troubledDisk());
    world.setDiskQuotaUsedUp(true);
    const std::string movie = world.makeMovie("two.mp4", {440, 880});
    const std::vector<char> before = bytesOf(movie);
    EXPECT_EQ(world.save(movie), 0);
    EXPECT_TRUE(bytesOf(world.onlySaved()) == before);
    EXPECT_EQ(world.countInLog(kNotMixed), 1u);
    EXPECT_TRUE(becomesGone(movie));
    EXPECT_TRUE(waitUntil([&] { return world.temporaryFiles().empty(); })) << "no half movie";
}

/// Asks as another user, from a thread that has become that one; the error's code.
std::int64_t saveAsUser(const SavingWorld& world, uid_t user, const std::string& movie) {
    std::int64_t code = 0;
    std::thread([&] {
        // The thread's alone: the system call, not the library's function. What the recorder starts inherits it.
        if (::syscall(SYS_setresuid, user, user, user) != 0) {
            ADD_FAILURE() << "can't become another user";
            return;
        }
        client::Recorder recorder({}, world.path("run/lumacast"));
        const auto error = recorder.saveAndWait(URL::file(movie), kPatience);
        code = error ? error->code() : 0;
    }).join();
    return code;
}

TEST(Saving, APathThatTheUserMayNotTouchIsRefusedAndNothingIsRemoved) {
    SavingWorld world;
    world.startDaemon();
    const std::string refusals = "may not read and remove it";
    if (::geteuid() != 0) {
        // Every user may read this file, and only the administrator remove it.
        EXPECT_EQ(world.save("/etc/passwd"), kFailedToSave);
        EXPECT_EQ(world.countInLog(refusals), 1u);
        EXPECT_TRUE(fs::exists("/etc/passwd"));
        return;
    }
    // As the administrator sets it up who offers the daemon to every user.
    for (const char* folder : {"", "run", "run/lumacast", "state", "state/lumacast", "movies"})
        fs::permissions(world.path(folder), fs::perms(0711));
    fs::permissions(world.path("run/lumacast/com.orvane.lumacastd.sock"), fs::perms(0777));

    const std::string secret = world.makeMovie("secret.mp4", {440}), readable = world.makeMovie("readable.mp4", {440});
    fs::permissions(secret, fs::perms(0600));
    fs::permissions(readable, fs::perms(0644));
    const std::string shared = world.path("shared"), kept = shared + "/kept.mp4", link = shared + "/link.mp4";
    fs::create_directory(shared);
    fs::permissions(shared, fs::perms(01777));
    fs::copy_file(readable, kept);
    fs::create_symlink(secret, link);
    EXPECT_EQ(::lchown(link.c_str(), kNobody, kNobody), 0);
    const std::string inside = world.temporaryDirectory() + "/../secret.mp4";
    fs::copy_file(secret, inside);
    std::size_t refused = 0;
    const std::string pipe = shared + "/pipe.mp4";
    EXPECT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    EXPECT_EQ(::chown(pipe.c_str(), kNobody, kNobody), 0);
    for (const std::string& path : {secret, readable, kept, link, inside, pipe, world.path("movies")}) {
        SCOPED_TRACE(path);
        EXPECT_EQ(saveAsUser(world, kNobody, path), kFailedToSave);
        EXPECT_EQ(world.countInLog(refusals), ++refused) << world.daemonLog();
        EXPECT_TRUE(fs::exists(path));
    }
    EXPECT_THAT(world.library(), IsEmpty());
    EXPECT_THAT(world.saveStates(), IsEmpty()) << "none was begun";

    // One of their own is taken; with a home that is not there it can't be saved, and goes as after every failure.
    const std::string own = shared + "/own.mp4";
    fs::copy_file(readable, own);
    EXPECT_EQ(::chown(own.c_str(), kNobody, kNobody), 0);
    EXPECT_EQ(saveAsUser(world, kNobody, own), kFailedToSave);
    EXPECT_EQ(world.countInLog(refusals), refused);
    EXPECT_THAT(world.saveStates(), ElementsAre("failed"));
    EXPECT_TRUE(becomesGone(own));
}

TEST(Saving, APipeInTheTemporaryDirectoryKeepsNobodyWaiting) {
    SavingWorld world;
    world.startDaemon();
    std::filesystem::create_directories(world.temporaryDirectory());
    // More than there are threads to wait on.
    constexpr int kPipes = 60;
    Answers<std::optional<Error>> answers;
    for (int i = 0; i < kPipes; ++i) {
        const std::string pipe = world.temporaryDirectory() + "/pipe " + std::to_string(i) + ".mp4";
        ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
        world.recorder().save(URL::file(pipe), answers.handler(i));
    }
    ASSERT_TRUE(waitUntil([&] { return answers.total() == kPipes; }, kPatience));
    EXPECT_THAT(world.library(), IsEmpty());
}

}  // namespace
}  // namespace lumacast::test
