// The daemon under the restrictions of its shipped unit (tests/system/confine applies what the unit's file says): it
// does all that it does without.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <array>
#include <filesystem>

#include "linux/ipc/Fd.h"
#include "tests/checkers/ToneChecker.h"
#include "tests/contract/RawPeer.h"
#include "tests/dialog/DialogUser.h"
#include "tests/system/Unit.h"
#include "tests/system/World.h"

#ifndef LC_SANITIZED  // a sanitizer's runtime needs what the unit forbids

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using checkers::Child;
using ::testing::HasSubstr;
using ::testing::StartsWith;

/// The user whose daemon it is: an ordinary one, if this process may choose.
uid_t theUser() {
    return ::geteuid() == 0 ? 61'000 : ::geteuid();
}

class Confined : public ::testing::Test {
protected:
    Confined() : notified_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
        for (const char* name : {"home", "videos", "sound"}) fs::create_directory(world_.path(name));
        for (const auto& [program, name] : {std::pair(LC_DAEMON, "lumacastd"),
                                            {LC_SELF_RECORDER, "player"},
                                            {LC_CTL, "ctl"},
                                            {LC_EXTENSION_LAUNCHER, "lumacast-extension-launcher"}})
            fs::copy_file(program, world_.path(name));
        world_.install("org.lumacast.Player", "Player", world_.path("player"));
        // What the administrator writes for this user.
        std::ofstream(world_.path("user.conf"))
            << "[Service]\nReadWritePaths=" << world_.path("videos")
            << "\nEnvironment=DISPLAY=" << world_.display().name() << " HOME=" << world_.path("home")
            << " XDG_VIDEOS_DIR=" << world_.path("videos") << " XDG_CONFIG_HOME=" << world_.path("config")
            << " XDG_DATA_HOME=" << world_.path("data")
            << " LANGUAGE=en PULSE_SERVER=unix:" << world_.path("sound/native") << " DBUS_SESSION_BUS_ADDRESS=\n";
        const sockaddr_un address = socketAddress(world_.path("notify"));
        EXPECT_EQ(::bind(notified_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        // The movies are where the unit's state directory is.
        world_.addVariable("XDG_STATE_HOME=" + world_.path("state"));
        giveAway();
    }
    void giveAway() {
        if (::geteuid() != 0) return;
        const auto give = [](const fs::path& path) { return ::lchown(path.c_str(), theUser(), theUser()); };
        EXPECT_EQ(give(world_.path("")), 0);
        for (const auto& entry : fs::recursive_directory_iterator(world_.path(""))) EXPECT_EQ(give(entry.path()), 0);
    }
    /// A command of the user's.
    static std::vector<std::string> asUser(std::vector<std::string> command) {
        const std::string user = std::to_string(theUser());
        if (::geteuid() == 0)
            command.insert(command.begin(), {"setpriv", "--reuid", user, "--regid", user, "--clear-groups"});
        return command;
    }
    void startDaemon() {
        const std::string user = std::to_string(theUser());
        world_.startDaemonBy({LC_CONFINE,
                              "--unit",
                              shippedUnit(),
                              "--drop-in",
                              world_.path("user.conf"),
                              "--instance",
                              user,
                              "--move",
                              "/run/user/" + user,
                              world_.path("run"),
                              "--move",
                              "/var/lib/lumacast/" + user,
                              world_.path("state"),
                              "--move",
                              "/var/cache/lumacast/" + user,
                              world_.path("cache"),
                              "--move",
                              "/home/" + user,
                              world_.path("home"),
                              "--program",
                              world_.path("lumacastd")},
                             {"NOTIFY_SOCKET=" + world_.path("notify")});
    }
    void startSound() {
        sound_ = std::make_unique<Child>(
            asUser({"pulseaudio", "-n", "--daemonize=no", "--exit-idle-time=-1", "--disallow-exit", "--use-pid-file=no",
                    "--realtime=no", "-L", "module-native-protocol-unix auth-cookie-enabled=0 socket=" + world_.path("sound/native"),
                    "-L", "module-null-sink sink_name=null0 rate=48000 norewinds=1"}),
            std::vector<std::string>{"XDG_RUNTIME_DIR=" + world_.path("sound"),
                                     "PULSE_RUNTIME_PATH=" + world_.path("sound"), "HOME=" + world_.path("sound")},
            world_.path("sound.log"));
        EXPECT_TRUE(waitUntil([&] { return fs::exists(world_.path("sound/native")); }))
            << textOf(world_.path("sound.log"));
    }
    std::unique_ptr<Application> application(std::vector<std::string> options) {
        std::string line = "exec";
        for (const std::string& word : asUser({world_.path("player")})) line += " '" + word + "'";
        const std::string starter = world_.path("start-player");
        std::ofstream(starter) << "#!/bin/sh\n" << line << " \"$@\"\n";
        fs::permissions(starter, fs::perms(0755));
        return std::make_unique<Application>(world_, starter, "Player", options);
    }
    bool hasSaved() {
        std::error_code none;
        for (const auto& entry : fs::directory_iterator(world_.path("videos/Lumacast"), none))
            if (entry.path().extension() == ".mp4") return true;
        return false;
    }
    /// A thread that stands back behind the daemon's first one.
    bool hasThreadBehind() {
        const int first = ::getpriority(PRIO_PROCESS, static_cast<id_t>(world_.daemon().pid()));
        std::error_code gone;
        for (const auto& task :
             fs::directory_iterator("/proc/" + std::to_string(world_.daemon().pid()) + "/task", gone))
            if (::getpriority(PRIO_PROCESS, static_cast<id_t>(std::stoi(task.path().filename().string()))) > first)
                return true;
        return false;
    }
    /// What the service manager was told next.
    std::string told() {
        std::array<char, 512> text{};
        const auto size = ::recv(notified_.get(), text.data(), text.size(), MSG_DONTWAIT);
        return size > 0 ? std::string(text.data(), static_cast<std::size_t>(size)) : "";
    }
    std::string statusOfDaemon(const std::string& name) { return statusOf(world_.daemon().pid(), name); }
    static std::string statusOf(pid_t process, const std::string& name) {
        const std::string text = textOf("/proc/" + std::to_string(process) + "/status");
        const auto at = text.find(name + ":");
        return at == std::string::npos ? ""
                                       : text.substr(at + name.size() + 2, text.find('\n', at) - at - name.size() - 2);
    }

    World world_{World::Consent::Asked};
    const Fd notified_;
    std::unique_ptr<Child> sound_;
};

TEST_F(Confined, TheDaemonAsksRecordsPictureAndSoundAndSaves) {
    startSound();
    world_.addVariable("PULSE_SERVER=unix:" + world_.path("sound/native"));
    startDaemon();
    std::string news;
    ASSERT_TRUE(waitUntil([&] { return (news += told()).find("READY=1") != std::string::npos; })) << world_.daemonLog();
    const auto player = application({"--size", "320x180", "--fps", "30", "--tone", "700"});
    ASSERT_TRUE(player->waitForFrame(30));
    player->send("start");
    DialogUser user(world_.display().name());
    ASSERT_TRUE(user.answer(DialogUser::Button::Default)) << world_.daemonLog();
    const std::string started = player->answer();
    ASSERT_THAT(started, StartsWith("started")) << world_.daemonLog();
    ASSERT_TRUE(world_.waitForElapsed(2)) << world_.daemonLog();
    const std::string movie = player->stop();
    ASSERT_FALSE(movie.empty()) << world_.daemonLog();
    const auto pictures = picturesOf(movie);
    EXPECT_GT(pictures.size(), 30u);
    std::size_t numbered = 0;
    for (const auto& picture : pictures) numbered += picture.number ? 1 : 0;
    EXPECT_EQ(numbered, pictures.size());
    checkers::MovieReader reader(movie);
    const auto sound = reader.readSound(0);
    ASSERT_TRUE(sound) << reader.error();
    EXPECT_GT(checkers::toneLevel(sound->samples, sound->rate, 700), -25);
    EXPECT_EQ(fs::status(movie).permissions(), fs::perms(0600));
    // Encoded anew, copied at low priority, into the one folder that the drop-in names.
    std::string saved;
    {
        Child tool(asUser({world_.path("ctl"), "save", movie}), world_.environment(), world_.path("tool.log"));
        EXPECT_TRUE(waitUntil([&] { return hasThreadBehind(); }, std::chrono::seconds(60)))
            << "what can wait is in a recording's way";
        // It has the time that the machine's other work leaves, which may be little.
        EXPECT_TRUE(waitUntil([&] { return hasSaved(); }, std::chrono::seconds(300)));
        saved = tool.readAll();
        EXPECT_EQ(tool.wait(), 0) << textOf(world_.path("tool.log")) << world_.daemonLog();
    }
    while (saved.ends_with('\n')) saved.pop_back();
    EXPECT_THAT(saved, StartsWith(world_.path("videos/")));
    EXPECT_GT(picturesOf(saved).size(), 30u);
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
}

TEST_F(Confined, TheDaemonHasNoRightsAndReachesNothingElse) {
    startDaemon();
    EXPECT_EQ(statusOfDaemon("NoNewPrivs"), "1");
    EXPECT_EQ(statusOfDaemon("Seccomp"), "2");
    for (const char* set : {"CapEff", "CapPrm", "CapInh", "CapAmb"}) EXPECT_EQ(statusOfDaemon(set), "0000000000000000");
    if (::geteuid() != 0) return;
    EXPECT_EQ(statusOfDaemon("CapBnd"), "0000000000000000");
    EXPECT_THAT(statusOfDaemon("Uid"), StartsWith(std::to_string(theUser())));
    // What the kernel shows of its mounts: nothing on a disk is writable but what the unit and the drop-in name.
    const std::string mounts = textOf("/proc/" + std::to_string(world_.daemon().pid()) + "/mountinfo");
    std::istringstream lines(mounts);
    int writable = 0, readOnly = 0;
    for (std::string line; std::getline(lines, line);) {
        std::istringstream text(line);
        std::string word, place, options;
        for (int i = 0; i < 4; ++i) text >> word;
        text >> place >> options;
        const bool kernels = place.starts_with("/dev") || place.starts_with("/proc") || place.starts_with("/sys");
        if (options.starts_with("ro")) ++readOnly;
        if (kernels || options.starts_with("ro")) continue;
        ++writable;
        EXPECT_TRUE(place == world_.path("run") || place == world_.path("state") || place == world_.path("cache") ||
                    place == world_.path("videos"))
            << line;
    }
    EXPECT_EQ(writable, 4) << mounts;
    EXPECT_GT(readOnly, 0);
}

TEST_F(Confined, BroadcastsReachTheirExtensionsAndTheseAreConfinedEvenMore) {
    const std::string clips = "org.lumacast.ClipKeeper", samples = "org.lumacast.SampleTaker";
    const std::string kept = world_.installExtension(clips, LC_MINIMAL_EXTENSION, false),
                      noted = world_.installExtension(samples, LC_SAMPLE_TAKER, true) + "/samples.log";
    giveAway();
    startDaemon();
    const auto player = application({"--size", "320x180", "--fps", "30"});
    ASSERT_TRUE(player->waitForFrame(30));
    DialogUser user(world_.display().name());
    // A clip is handed over by a token, and the extension keeps a copy of its own.
    player->send("broadcast org.lumacast.Player " + clips + " directory=" + kept);
    ASSERT_TRUE(user.answer(DialogUser::Button::Default)) << world_.daemonLog();
    ASSERT_THAT(player->answer(), StartsWith("started")) << world_.daemonLog();
    ASSERT_TRUE(waitUntil([&] { return fs::exists(kept + "/clip-2.mp4"); }, std::chrono::seconds(60)))
        << world_.daemonLog();
    EXPECT_THAT(player->ask("stop"), HasSubstr("without movie"));
    EXPECT_GT(picturesOf(kept + "/clip-1.mp4").size(), 10u);
    // A sample is handed over in shared memory. The user isn't asked again so soon.
    ASSERT_THAT(player->ask("broadcast org.lumacast.Player " + samples + " -"), StartsWith("started"))
        << world_.daemonLog();
    ASSERT_TRUE(waitUntil([&] {
        const std::string text = textOf(noted);
        return std::count(text.begin(), text.end(), '\n') > 30;
    })) << world_.daemonLog();
    const pid_t extension = world_.extensionProcess(samples);
    ASSERT_GT(extension, 1);
    EXPECT_EQ(statusOf(extension, "NoNewPrivs"), "1");
    EXPECT_GT(std::stoi(statusOf(extension, "Seccomp_filters")), std::stoi(statusOfDaemon("Seccomp_filters")))
        << "its own filter is on top of the unit's";
    EXPECT_EQ(statusOf(extension, "CapEff"), "0000000000000000");
    EXPECT_THAT(world_.daemonLog(), HasSubstr("extensions run with file rules and a system call filter alone"));
    EXPECT_THAT(player->ask("stop"), HasSubstr("without movie"));
    EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
}

}  // namespace
}  // namespace lumacast::test

#endif
