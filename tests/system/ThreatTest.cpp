// What docs/threat-model.md says: one hostile process for each claim that no other test shows.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>

#include <filesystem>
#include <regex>
#include <set>
#include <sstream>
#include <thread>

#include "client/Recorder.h"
#include "tests/checkers/ToneChecker.h"
#include "tests/contract/TestWindow.h"
#include "tests/sound/PrivateSoundServer.h"
#include "tests/system/MovingWindow.h"
#include "tests/system/RawClient.h"
#include "tests/system/Unit.h"
#include "tests/system/World.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using checkers::Child;
using ::testing::HasSubstr;

/// Nobody's number.
constexpr uid_t kStranger = 61'001;

class Threat : public ::testing::Test {
protected:
    Threat() { fs::copy_file(LC_VISITOR, hostile_ = world_.path("hostile")); }

    /// Everything is open as far as the daemon didn't close it itself.
    void openTheWorld() {
        for (const char* folder : {"", "run", "state", "data", "cache", "config"})
            fs::permissions(world_.path(folder), fs::perms(0755));
    }
    /// As the administrator sets it up who offers the daemon to every user.
    void offerToEverybody() {
        openTheWorld();
        fs::permissions(world_.path("run/lumacast"), fs::perms(0711));
        fs::permissions(world_.path("run/lumacast/com.orvane.lumacastd.sock"), fs::perms(0777));
    }
    /// A program that asks for its state: "state" when it is served as an application, else "none".
    std::string visit(const std::vector<std::string>& command) {
        Child visitor(command, world_.environment(), world_.path("visitor.log"));
        const std::string line = visitor.readLine();
        return line.empty() ? textOf(world_.path("visitor.log")) : line;
    }
    /// The same from an ordinary user's process with file systems of its own, where a script decides what lies where.
    /// It is somebody else's than the administrator's, who could be stopped from nothing.
    std::string visitFromSandbox(const std::string& script) {
        std::vector<std::string> command;
        const std::string stranger = std::to_string(kStranger);
        if (::geteuid() == 0) command = {"setpriv", "--reuid", stranger, "--regid", stranger, "--clear-groups"};
        for (const char* word : {"unshare", "--user", "--map-root-user", "--mount", "sh", "-ec"})
            command.push_back(word);
        command.push_back(script);
        return visit(command);
    }
    /// An application of the administrator's, in /usr/bin. Its daemon serves sandboxes, too: what another application
    /// runs there is that application.
    void installForSandboxes() {
        world_.install("org.lumacast.Player", "Player", "/usr/bin/xdotool");
        fs::copy_file(LC_VISITOR, world_.path("honest"));
        world_.install("org.lumacast.Honest", "Honest", world_.path("honest"));
        world_.startDaemon();
        offerToEverybody();
        EXPECT_EQ(visitFromSandbox("exec " + world_.path("honest")), "state");
    }
    client::StartOptions optionsFor(std::vector<ContextID> windows) {
        client::StartOptions options;
        options.windows = std::move(windows);
        options.size = {320, 240};
        return options;
    }
    /// A desktop that does not say within its time who is in front says "nobody"; on a busy machine one asks again.
    std::optional<Error> start(client::Recorder& recorder, const client::StartOptions& options) {
        for (int i = 0; i < 20; ++i) {
            const auto error = recorder.startAndWait(options).error;
            if (!error || error->code() != -5803) return error;
        }
        return recorder.startAndWait(options).error;
    }

    World world_;
    std::string hostile_;
};

TEST(ThreatModel, NamesATestThatIsThereForEachClaim) {
    std::set<std::string> tests;
    const std::regex declaration(R"(TEST(?:_[FP])?\((\w+),\s*(\w+)\))");
    for (const auto& entry : fs::recursive_directory_iterator(std::string(LC_SOURCE_DIR) + "/tests")) {
        if (entry.path().extension() != ".cpp") continue;
        const std::string text = textOf(entry.path());
        for (std::sregex_iterator found(text.begin(), text.end(), declaration), end; found != end; ++found)
            tests.insert((*found)[1].str() + "." + (*found)[2].str());
    }
    std::istringstream lines(textOf(std::string(LC_SOURCE_DIR) + "/docs/threat-model.md"));
    const std::regex name("`([A-Z][A-Za-z0-9]+\\.[A-Z][A-Za-z0-9]+)`");
    int claims = 0;
    for (std::string line; std::getline(lines, line);) {
        if (!line.starts_with("| ") || line.starts_with("| claim") || line.starts_with("| **a") ||
            line.starts_with("| actor"))
            continue;
        if (line.starts_with("| **root") || line.starts_with("| **another")) continue;
        ++claims;
        int named = 0;
        for (std::sregex_iterator found(line.begin(), line.end(), name), end; found != end; ++found, ++named)
            EXPECT_TRUE(tests.contains((*found)[1].str())) << (*found)[1].str() << " is no test";
        EXPECT_GT(named, 0) << line;
    }
    EXPECT_GT(claims, 30);
}

// Another user's process.

TEST_F(Threat, AnotherUserCanNeitherAskNorReadMoviesNorTheUsage) {
    openTheWorld();
    world_.startDaemon();
    const auto application = world_.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world_.waitForElapsed(0.3));
    const std::string movie = application->stop();
    const std::string usage = world_.path("state/lumacast/telemetry.jsonl");
    ASSERT_TRUE(waitUntil([&] { return fs::exists(usage); }));
    for (const std::string& folder : {world_.path("run/lumacast"), world_.path("state/lumacast")})
        EXPECT_EQ(fs::status(folder).permissions(), fs::perms(0700)) << folder;
    for (const std::string& file : {movie, usage, world_.path("run/lumacast/admin.sock")})
        EXPECT_EQ(fs::status(file).permissions(), fs::perms(0600)) << file;
    if (::geteuid() != 0) return;  // can't become another user: the permissions must do
    std::thread([&] {
        // The thread's alone: the system call, not the library's function.
        ASSERT_EQ(::syscall(SYS_setresuid, kStranger, kStranger, kStranger), 0);
        EXPECT_FALSE(RawPeer().connectTo(servicePath(world_)));
        EXPECT_FALSE(RawPeer().connectTo(world_.path("run/lumacast/admin.sock")));
        for (const std::string& file : {movie, usage}) EXPECT_LT(::open(file.c_str(), O_RDONLY), 0) << file;
    }).join();
}

TEST_F(Threat, AnotherUserIsNotHeardAtTheAdministratorsSocketHoweverItCameThere) {
    world_.startDaemon();
    EXPECT_EQ(fs::status(world_.path("run/lumacast")).permissions(), fs::perms(0700));
    if (::geteuid() != 0) return;  // can't become another user: the permissions must do
    const std::string socket = world_.path("run/lumacast/admin.sock");
    openTheWorld();
    fs::permissions(world_.path("run/lumacast"), fs::perms(0711));
    fs::permissions(socket, fs::perms(0777));
    std::thread([&] {
        ASSERT_EQ(::syscall(SYS_setresuid, kStranger, kStranger, kStranger), 0);
        RawPeer stranger;
        ASSERT_TRUE(stranger.connectTo(socket));
        const std::string question = "status\n";
        stranger.send({reinterpret_cast<const std::uint8_t*>(question.data()), question.size()});
        EXPECT_TRUE(stranger.read(1).empty());
    }).join();
}

// Whose identity a process can take.

TEST_F(Threat, ACopyOfAnApplicationsProgramIsNotTheApplication) {
    fs::copy_file(LC_VISITOR, world_.path("player"));
    world_.install("org.lumacast.Player", "Player", world_.path("player"));
    world_.startDaemon();
    fs::create_directory(world_.path("copies"));
    fs::copy_file(LC_VISITOR, world_.path("copies/player"));
    EXPECT_EQ(visit({world_.path("player")}), "state");
    EXPECT_EQ(visit({world_.path("copies/player")}), "none");
}

TEST_F(Threat, AProgramThatASandboxHasPutInAnApplicationsPlaceIsNotTheApplication) {
    // An application of the administrator's; its place is /usr/bin.
    installForSandboxes();
    EXPECT_EQ(visitFromSandbox("mount --bind " + hostile_ + " /usr/bin/xdotool; exec /usr/bin/xdotool"), "none");
}

TEST_F(Threat, AProgramThatASandboxHasPutInAnApplicationsPlaceAndRemovedIsNotTheApplicationEither) {
    installForSandboxes();
    // What runs shows as "/usr/bin/xdotool (deleted)", like an application that was replaced while it ran.
    EXPECT_EQ(visitFromSandbox("mount -t tmpfs none /mnt; cp " + hostile_ +
                               " /mnt/xdotool; cp /bin/rm /mnt/rm; mount --bind /mnt /usr/bin;"
                               "exec 3</usr/bin/xdotool; /usr/bin/rm /usr/bin/xdotool; exec /proc/self/fd/3"),
              "none");
}

TEST_F(Threat, AScriptIsNoApplicationWhateverItsEntryNames) {
    const std::string script = world_.path("player.py");
    const std::string link = world_.path("player");
    fs::create_symlink("/usr/bin/python3", link);
    const std::string ask =
        "import os, socket, sys\n"
        "s = socket.socket(socket.AF_UNIX)\n"
        "s.connect(os.environ['XDG_RUNTIME_DIR'] + '/lumacast/com.orvane.lumacastd.sock')\n"
        "s.sendall(bytes.fromhex(sys.argv[1]))\n"
        "got = b''\n"
        "try:\n"
        "    while len(got) < 17:\n"
        "        more = s.recv(64)\n"
        "        if not more: break\n"
        "        got += more\n"
        "except ConnectionResetError: pass\n"
        "print('state' if len(got) > 16 else 'none')\n";
    std::ofstream(script) << ask;
    Data bytes = makeHello();
    const Data request = requestState(1);
    bytes.insert(bytes.end(), request.begin(), request.end());
    std::string hex;
    for (const std::uint8_t byte : bytes) hex += {"0123456789abcdef"[byte >> 4], "0123456789abcdef"[byte & 15]};
    // By a link with the application's name, and by the key that names the program behind a launcher.
    world_.install("org.lumacast.Player", "Player", link);
    std::ofstream(world_.path("data/applications/org.lumacast.Other.desktop"))
        << "[Desktop Entry]\nType=Application\nName=Other\nExec=" << script
        << "\nX-Lumacast-Executable=/usr/bin/python3\n";
    world_.startDaemon();
    EXPECT_EQ(visit({link, script, hex}), "none");
    EXPECT_EQ(visit({"/usr/bin/python3", script, hex}), "none");
}

TEST_F(Threat, WhatAUserHasPutIntoAnApplicationsProcessOrEntryIsThatApplication) {
    // Deliberately not prevented: processes and entries of a user are that user's.
    fs::copy_file(LC_VISITOR, world_.path("player"));
    world_.install("org.lumacast.Player", "Player", world_.path("player"));
    world_.startDaemon();
    EXPECT_EQ(visit({"env", "LD_PRELOAD=" + std::string(LC_SLOW_DISK), world_.path("player")}), "state");
    world_.install("org.lumacast.Player", "Player", hostile_);
    EXPECT_TRUE(waitUntil([&] { return visit({hostile_}) == "state"; }));
}

TEST_F(Threat, AnEntryOfTheUsersGivesNoEntitlement) {
    fs::create_directories(world_.path("etc/lumacast/entitlements.d"));
    std::ofstream(world_.path("etc/lumacast/entitlements.d/tests.conf"))
        << "[org.lumacast.Tests]\ncom.orvane.private.luma-cast=true\n";
    installThisProcess(world_);
    const std::string entry = world_.path("data/applications/org.lumacast.Tests.desktop");
    if (::geteuid() == 0) {
        ASSERT_EQ(::chown(entry.c_str(), kStranger, kStranger), 0);
    }
    world_.startDaemon({"XDG_CONFIG_DIRS=" + world_.path("etc")});
    client::Recorder recorder({}, world_.path("run/lumacast"));
    client::StartOptions screen = optionsFor({});
    screen.systemRecording = true;
    const auto error = recorder.startAndWait(screen).error;
    ASSERT_TRUE(error);
    EXPECT_EQ(client::recordingCodeOf(*error), RecordingErrorCode::Entitlements);
    EXPECT_TRUE(world_.recording().is_null());
}

// What a recording shows and plays.

TEST_F(Threat, ARecordingOfNoWindowShowsNobodysWindows) {
    installThisProcess(world_);
    world_.startDaemon();
    const auto victim = world_.application(kMoving);
    ASSERT_TRUE(victim->waitForFrame(1));
    TestWindow window(world_.display().name(), TestWindow::Look{.place = {600, 400, 100, 100}, .colour = 0x336699});
    client::Recorder recorder({}, world_.path("run/lumacast"));
    const auto error = start(recorder, optionsFor({}));
    ASSERT_FALSE(error) << error->code() << world_.daemonLog();
    // While there is nothing to show its clock stands; in the end it fails.
    EXPECT_TRUE(waitUntil([&] { return world_.recording().is_null(); })) << world_.daemonLog();
    const std::string movie = world_.moviePath("Tests");
    if (!fs::exists(movie)) return;
    checkers::MovieReader reader(movie);
    std::vector<checkers::NumberedPicture> pictures;
    (void)checkers::readFrameNumbers(reader, pictures);
    for (const auto& picture : pictures) EXPECT_FALSE(picture.number) << "a picture of somebody else's window";
}

TEST_F(Threat, TheSoundOfAnyProcessOfTheUserCanBeAskedFor) {
    // Deliberately not prevented: any process can be named. A client of the sound server could listen to it as
    // well.
    PrivateSoundServer sound;
    ASSERT_TRUE(sound.isThere());
    world_.addVariable("PULSE_SERVER=" + sound.address());
    world_.addVariable("DBUS_SESSION_BUS_ADDRESS=");
    installThisProcess(world_);
    world_.startDaemon();
    const auto victim = world_.otherApplication("Plays", {"--size", "320x180", "--fps", "10", "--tone", "700"});
    ASSERT_TRUE(victim->waitForFrame(20));
    TestWindow window(world_.display().name(), TestWindow::Look{.place = {600, 400, 100, 100}, .colour = 0x336699});
    client::Recorder recorder({}, world_.path("run/lumacast"));
    const auto error = start(recorder, optionsFor({window.context()}));
    ASSERT_FALSE(error) << error->code() << world_.daemonLog();
    recorder.setProcessForAudioCapture(ProcessID{victim->pid()});
    ASSERT_TRUE(world_.waitForElapsed(4));
    const auto stopped = recorder.stopAndWait();
    ASSERT_TRUE(stopped.movie) << world_.daemonLog();
    checkers::MovieReader movie(stopped.movie->path());
    const auto heard = movie.readSound(0);
    ASSERT_TRUE(heard) << movie.error();
    EXPECT_GT(checkers::toneLevel(heard->samples, heard->rate, 700), -30);
}

TEST_F(Threat, AnyClientOfTheDisplayReadsAnyWindowWithoutTheDaemon) {
    // Deliberately shown: on X11 what the daemon refuses can be had from the display server.
    TestWindow victim(world_.display().name(), TestWindow::Look{.place = {0, 0, 64, 64}, .colour = 0x336699});
    victim.paint(0x336699);
    TestWindow spy(world_.display().name(), TestWindow::Look{.place = {600, 400, 10, 10}});
    std::unique_ptr<xcb_get_image_reply_t, void (*)(void*)> seen(
        xcb_get_image_reply(spy.connection(),
                            xcb_get_image(spy.connection(), XCB_IMAGE_FORMAT_Z_PIXMAP, victim.id(), 8, 8, 1, 1, ~0U),
                            nullptr),
        &std::free);
    ASSERT_TRUE(seen);
    const std::uint8_t* pixel = xcb_get_image_data(seen.get());
    EXPECT_EQ(pixel[0], 0x99);
    EXPECT_EQ(pixel[2], 0x33);
}

// Files.

TEST_F(Threat, ALinkInAMoviesPlaceIsReplacedAndWhatItNamesIsLeftAlone) {
    const std::string precious = world_.path("precious");
    std::ofstream(precious) << "precious";
    world_.startDaemon();
    fs::create_symlink(precious, world_.moviePath());
    const auto application = world_.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world_.waitForElapsed(0.5)) << world_.daemonLog();
    const std::string movie = application->stop();
    EXPECT_FALSE(picturesOf(movie).empty());
    EXPECT_FALSE(fs::is_symlink(world_.moviePath()));
    EXPECT_TRUE(textOf(precious) == "precious") << "written through the link";
}

TEST_F(Threat, TheUsageNamesNoWindowNoApplicationAndNoPlace) {
    world_.startDaemon();
    const auto application = world_.application(kMoving);
    ASSERT_TRUE(application->waitForFrame(1));
    (void)application->askForFrame("start");
    ASSERT_TRUE(world_.waitForElapsed(0.3));
    (void)application->stop();
    const std::string usage = world_.path("state/lumacast/telemetry.jsonl");
    ASSERT_TRUE(waitUntil([&] { return !textOf(usage).empty(); }));
    const std::string text = textOf(usage);
    for (const std::string& secret : {std::string("Self Recorder"), std::string("SelfRecorder"), world_.path("")})
        EXPECT_EQ(text.find(secret), std::string::npos) << text;
}

}  // namespace
}  // namespace lumacast::test
