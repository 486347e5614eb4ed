// The doctor's probes on real services of the test's own, each there and not there.

#include <sys/socket.h>
#include <unistd.h>

#include "client/lumacastctl/doctor/Daemon.h"
#include "client/lumacastctl/doctor/Display.h"
#include "client/lumacastctl/doctor/Encoders.h"
#include "client/lumacastctl/doctor/Resources.h"
#include "client/lumacastctl/doctor/Sound.h"
#include "client/lumacastctl/doctor/Storage.h"
#include "linux/admin/UnixSocket.h"
#include "linux/apps/LinuxBundles.h"
#include "linux/media/VideoEncoder.h"
#include "linux/storage/LinuxFileSystem.h"
#include "support/TempStore.h"
#include "tests/contract/PrivateDisplay.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/unit/lumacastctl/FindingMatchers.h"
#include "tests/unit/lumacastctl/Snapshots.h"
#include "tests/unit/lumacastctl/StandInDaemon.h"

namespace lumacast::ctl {
namespace {

using ::testing::AnyOf;
using ::testing::Contains;
constexpr std::chrono::seconds kPatience{20};
constexpr std::chrono::milliseconds kShort{50};

LinuxEnvironment::Variables variables(std::map<std::string, std::string, std::less<>> values) {
    return [values = std::move(values)](std::string_view name) -> std::optional<std::string> {
        const auto found = values.find(name);
        return found == values.end() ? std::nullopt : std::optional(found->second);
    };
}

// --- display ---

TEST(DisplayProbe, FindsAllThatCapturingTakesOnARealServer) {
    const test::PrivateDisplay display("320x200x24");
    ASSERT_FALSE(display.name().empty());
    const DisplayFacts facts = probeDisplay(variables({{"DISPLAY", display.name()}}), kPatience);
    EXPECT_EQ(facts.reach, DisplayFacts::Reach::Connected);
    EXPECT_TRUE(facts.takesMemoryByDescriptor);
    EXPECT_FALSE(facts.isWaylandSession);
    EXPECT_THAT(checkDisplay(facts), AllAre(Severity::Ok));
}

TEST(DisplayProbe, FindsPixelsThatCannotBeCaptured) {
    const test::PrivateDisplay display("320x200x16");
    ASSERT_FALSE(display.name().empty());
    const DisplayFacts facts = probeDisplay(variables({{"DISPLAY", display.name()}}), kPatience);
    EXPECT_EQ(facts.reach, DisplayFacts::Reach::Connected);
    EXPECT_FALSE(facts.pixelsAreBgrx);
}

TEST(DisplayProbe, DoesNotWaitForAServerThatHangs) {
    const test::PrivateDisplay display("320x200x24");
    ASSERT_FALSE(display.name().empty());
    display.hang();
    EXPECT_EQ(probeDisplay(variables({{"DISPLAY", display.name()}}), kShort).reach, DisplayFacts::Reach::NoAnswer);
}

TEST(DisplayProbe, TellsAServerThatHasGoneAndOneThatIsFarAway) {
    test::PrivateDisplay display("320x200x24");
    ASSERT_FALSE(display.name().empty());
    display.kill();
    EXPECT_EQ(probeDisplay(variables({{"DISPLAY", display.name()}}), kPatience).reach, DisplayFacts::Reach::NoServer);
    EXPECT_EQ(probeDisplay(variables({{"DISPLAY", "far.example:0"}}), kPatience).reach, DisplayFacts::Reach::NotLocal);
    EXPECT_EQ(probeDisplay(variables({{"DISPLAY", "nonsense"}}), kPatience).reach, DisplayFacts::Reach::NotLocal);
    EXPECT_EQ(probeDisplay(variables({}), kPatience).name, "");
}

TEST(DisplayProbe, KnowsAWaylandSessionByEitherVariable) {
    EXPECT_TRUE(probeDisplay(variables({{"WAYLAND_DISPLAY", "wayland-0"}}), kPatience).isWaylandSession);
    EXPECT_TRUE(probeDisplay(variables({{"XDG_SESSION_TYPE", "wayland"}}), kPatience).isWaylandSession);
    EXPECT_FALSE(probeDisplay(variables({{"XDG_SESSION_TYPE", "x11"}}), kPatience).isWaylandSession);
}

// --- sound ---

TEST(SoundProbe, LooksWhereTheServersListen) {
    const ScratchDirectory scratch;
    scratch.makeDirectory("pulse");
    const Fd pulse = listenAt(scratch.path("pulse/native"));
    ASSERT_TRUE(pulse);
    const SoundFacts facts = probeSound(variables({{"XDG_RUNTIME_DIR", scratch.path()}}));
    ASSERT_EQ(facts.sockets.size(), 2u);
    EXPECT_EQ(facts.sockets[0].path, scratch.path("pulse/native"));
    EXPECT_TRUE(facts.sockets[0].answers);
    EXPECT_EQ(facts.sockets[1].path, scratch.path("pipewire-0"));
    EXPECT_FALSE(facts.sockets[1].answers);
}

TEST(SoundProbe, FollowsTheServersOwnVariables) {
    const auto paths = [](std::map<std::string, std::string, std::less<>> values) {
        const SoundFacts facts = probeSound(variables(std::move(values)));
        return facts.sockets[0].path + " " + facts.sockets[1].path;
    };
    EXPECT_EQ(paths({{"XDG_RUNTIME_DIR", "/r"}, {"PULSE_SERVER", "unix:/p"}, {"PIPEWIRE_REMOTE", "/w"}}), "/p /w");
    EXPECT_EQ(paths({{"XDG_RUNTIME_DIR", "/r"}, {"PULSE_RUNTIME_PATH", "/p"}, {"PIPEWIRE_RUNTIME_DIR", "/w"}}),
              "/p/native /w/pipewire-0");
}

// --- encoders ---

TEST(EncoderProbe, FindsTheSoftwareThatTheDaemonEncodesWith) {
    const EncoderFacts facts = probeEncoders();
    EXPECT_TRUE(facts.isLoaded) << facts.library;
    EXPECT_THAT(facts.present, Contains(kSavingSoftware));
    EXPECT_EQ(facts.software, kLiveSoftware);
    if (facts.ownLibrary.empty()) {
        EXPECT_THAT(facts.present, Contains(facts.software));
    } else {
        EXPECT_TRUE(facts.ownIsLoaded) << facts.ownLibrary;
    }
}

TEST(EncoderProbe, LooksForTheSoftwareThatTheDaemonOfThisBuildIsMadeWith) {
    EXPECT_EQ(kLiveSoftware, std::string("lib") + LC_H264);
    EXPECT_EQ(probeEncoders().ownLibrary.empty(), std::string(LC_H264) == "x264");
}

TEST(EncoderProbe, LooksForTheEncodersThatARecordingTries) {
    const auto& candidates = media::EncoderChoice::kCandidates;
    EXPECT_EQ(std::vector<std::string>(kEncoders.begin(), kEncoders.end()),
              std::vector<std::string>(candidates.begin(), candidates.end()));
}

// --- temporary directory ---

TEST(StorageProbe, LooksAtTheDirectoryThatTheDaemonUses) { EXPECT_EQ(kTemporaryDirectory, kDeviceTemporaryDirectory); }

TEST(StorageProbe, WantsTheSpaceThatTheDaemonWants) {
    SimWorld world(1);
    TempStore store(world.fakes.platform());
    store._srSetupTempDirectory();
    world.fakes.fileSystem.setFreeSize(kNeededFreeBytes);
    EXPECT_FALSE(store._srDeviceHasSufficientFreeSpaceForRecording());
    world.fakes.fileSystem.setFreeSize(kNeededFreeBytes + 1);
    EXPECT_TRUE(store._srDeviceHasSufficientFreeSpaceForRecording());
}

TEST(StorageProbe, TellsADirectoryFromNoneAndFromSomethingElse) {
    const ScratchDirectory scratch;
    StorageFacts facts = probeStorage(scratch.path(), std::nullopt);
    EXPECT_EQ(facts.state, StorageFacts::State::Missing);
    EXPECT_EQ(facts.nearest, scratch.path());
    EXPECT_TRUE(facts.isWritable);
    EXPECT_GT(facts.freeBytes.value_or(0), 0u);

    const std::string path = scratch.makeDirectory(std::string(kTemporaryDirectory).substr(1));
    facts = probeStorage(scratch.path(), path + "/");
    EXPECT_EQ(facts.state, StorageFacts::State::Directory);
    EXPECT_EQ(facts.nearest, path);
    EXPECT_EQ(facts.path, facts.daemonsPath);

    std::filesystem::remove(path);
    std::filesystem::create_directory_symlink("/", path);
    EXPECT_EQ(probeStorage(scratch.path(), std::nullopt).state, StorageFacts::State::SomethingElse);
}

TEST(StorageProbe, TellsAPlaceThatThisUserCannotWriteTo) {
    const ScratchDirectory scratch;
    const std::string closed = scratch.makeDirectory("closed");
    std::filesystem::permissions(closed, std::filesystem::perms::owner_read | std::filesystem::perms::owner_exec);
    const StorageFacts facts = probeStorage(closed + "/no/such", std::nullopt);
    EXPECT_EQ(facts.nearest, closed);
    EXPECT_EQ(facts.isWritable, ::geteuid() == 0) << "the superuser may write anywhere";
}

// --- resources ---

TEST(ResourceProbe, ReadsTheBundleAsTheDaemonDoes) {
    LinuxBundles::Options options;
    options.frameworkBundlePath = LC_SOURCE_DIR "/resources/Lumacast.bundle";
    options.locales = userLocales("de_AT", "");
    options.patience = kPatience;
    LinuxBundles bundles(options);
    EXPECT_THAT(checkResources(probeResources(bundles, "/data")), Contains(Finds(Severity::Ok, "yours is de.")));
}

TEST(ResourceProbe, TellsABundleThatIsNotThere) {
    LinuxBundles::Options options;
    options.frameworkBundlePath = "/no/such/Lumacast.bundle";
    LinuxBundles bundles(options);
    EXPECT_FALSE(probeResources(bundles, "/data").localizations.has_value());
}

// --- daemon ---

TEST(DaemonProbe, HearsADaemonThatRuns) {
    const ScratchDirectory scratch;
    const StandInDaemon daemon(scratch.path(), snapshotOfARecording);
    const DaemonFacts facts = probeDaemon(scratch.path(), true, kPatience);
    EXPECT_EQ(facts.admin, DaemonFacts::Socket::Answers);
    EXPECT_EQ(facts.service, DaemonFacts::Socket::Answers);
    EXPECT_EQ(facts.temporaryDirectory, "/root/private/var/mobile/Library/Lumacast/");
    EXPECT_TRUE(facts.pathFits);
}

TEST(DaemonProbe, HearsNobodyWhereNobodyIs) {
    const ScratchDirectory scratch;
    const DaemonFacts facts = probeDaemon(scratch.path(), true, kPatience);
    EXPECT_EQ(facts.admin, DaemonFacts::Socket::Closed);
    EXPECT_EQ(facts.service, DaemonFacts::Socket::Closed);
    EXPECT_EQ(facts.temporaryDirectory, std::nullopt);
}

TEST(DaemonProbe, TellsADaemonThatHangs) {
    const ScratchDirectory scratch;
    const StandInDaemon daemon(scratch.path(), emptySnapshot, StandInDaemon::Lane::Hangs);
    const DaemonFacts facts = probeDaemon(scratch.path(), true, std::chrono::milliseconds(300));
    EXPECT_EQ(facts.admin, DaemonFacts::Socket::Silent);
    EXPECT_EQ(facts.service, DaemonFacts::Socket::Silent);
}

TEST(DaemonProbe, TellsSocketsThatSomebodyElseListensAt) {
    const ScratchDirectory scratch;
    const Fd admin = listenAt(scratch.path("admin.sock"));
    const Fd service = listenAt(scratch.path("com.orvane.lumacastd.sock"));
    ASSERT_TRUE(admin && service);
    const DaemonFacts facts = probeDaemon(scratch.path(), true, kShort);
    EXPECT_EQ(facts.admin, DaemonFacts::Socket::Silent);
    EXPECT_EQ(facts.service, DaemonFacts::Socket::Silent);
}

TEST(DaemonProbe, TellsADaemonThatHasNoPlaceToWaitLeft) {
    const ScratchDirectory scratch;
    const Fd service = listenAt(scratch.path("com.orvane.lumacastd.sock"));
    ASSERT_EQ(::listen(service.get(), 0), 0);
    const Fd waiting = connectToServiceSocket(scratch.path(), "com.orvane.lumacastd");
    ASSERT_TRUE(waiting);
    ASSERT_FALSE(connectToServiceSocket(scratch.path(), "com.orvane.lumacastd")) << "there is still a place";
    EXPECT_EQ(probeDaemon(scratch.path(), true, kShort).service, DaemonFacts::Socket::Silent);
}

TEST(DaemonProbe, FindsARuntimeDirectoryWhosePathIsTooLong) {
    EXPECT_FALSE(probeDaemon("/" + std::string(100, 'x'), true, kShort).pathFits);
}

}  // namespace
}  // namespace lumacast::ctl
