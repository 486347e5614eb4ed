// Applications on a disk made for the test.
#include "linux/apps/LinuxBundles.h"

#include <gmock/gmock.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <thread>

#include "linux/apps/Entitlements.h"
#include "linux/apps/ProcessImage.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/linux_apps/RunningProgram.h"

namespace lumacast {
namespace {

using testing::ElementsAre;
namespace fs = std::filesystem;

struct Disk {
    Disk() {
        fs::create_directories(scratch.path("home/applications"));
        fs::create_directories(scratch.path("system/applications"));
        options.applicationDirectories = {scratch.path("home/applications"), scratch.path("system/applications")};
        options.searchPath = {scratch.path("bin")};
        options.locales = userLocales("de", "");
        options.patience = std::chrono::seconds(30);
    }

    std::string installProgram(const std::string& name) const { return installExecutable(scratch.path(name)); }
    void installEntry(const std::string& name, const std::string& lines) const {
        scratch.write(name, "[Desktop Entry]\nType=Application\n" + lines);
    }
    std::optional<BundleIdentifier> identifierOf(const std::string& program) {
        const auto path = bundles().bundlePathForExecutable(program);
        const auto bundle = path ? bundles().open(*path) : nullptr;
        return bundle ? bundle->identifier() : std::nullopt;
    }
    LinuxBundles& bundles() {
        if (!bundles_) bundles_.emplace(options);
        return *bundles_;
    }

    ScratchDirectory scratch;
    LinuxBundles::Options options;

private:
    std::optional<LinuxBundles> bundles_;
};

const BundleIdentifier kPlayer("org.example.Player");

TEST(LinuxBundles, AProgramBelongsToTheEntryThatStartsIt) {
    Disk disk;
    const std::string program = disk.installProgram("bin/player");
    disk.installEntry("system/applications/org.example.Player.desktop",
                      "Name=Player\nName[de]=Spieler\nExec=player %U\n");
    EXPECT_EQ(disk.identifierOf(program), kPlayer);
    const auto bundle = disk.bundles().withIdentifier(kPlayer);
    ASSERT_TRUE(bundle);
    EXPECT_EQ(bundle->localizedInfo(kInfoDisplayName), "Spieler");
    EXPECT_EQ(bundle->info(kInfoDisplayName), "Player");
    EXPECT_EQ(bundle->info(kInfoName), "Player");
    EXPECT_EQ(disk.identifierOf(disk.installProgram("bin/other")), std::nullopt);
}

TEST(LinuxBundles, LinksToTheProgramAreFollowed) {
    Disk disk;
    const std::string program = disk.installProgram("opt/player-1.2");
    fs::create_directories(disk.scratch.path("bin"));
    fs::create_symlink(program, disk.scratch.path("bin/player"));
    disk.installEntry("system/applications/org.example.Player.desktop", "Exec=player\n");
    EXPECT_EQ(disk.identifierOf(program), kPlayer);
}

TEST(LinuxBundles, TheOwnProgramOfALauncherIsNamed) {
    Disk disk;
    const std::string program = disk.installProgram("opt/player-real");
    disk.installProgram("bin/launcher");
    disk.installEntry("system/applications/org.example.Player.desktop",
                      "Exec=launcher player\nX-Lumacast-Executable=" + program + "\n");
    EXPECT_EQ(disk.identifierOf(program), kPlayer);
    EXPECT_EQ(disk.identifierOf(disk.scratch.path("bin/launcher")), std::nullopt);
}

TEST(LinuxBundles, AnInterpreterIsNobodysProgramWhateverItIsCalled) {
    Disk disk;
    const std::string interpreter = disk.installProgram("opt/python3.11");
    fs::create_directories(disk.scratch.path("bin"));
    fs::create_symlink(interpreter, disk.scratch.path("bin/player"));
    disk.installEntry("system/applications/org.example.Player.desktop", "Exec=player\n");
    EXPECT_EQ(disk.identifierOf(interpreter), std::nullopt);
    disk.installEntry("home/applications/org.example.Player.desktop",
                      "Exec=player\nX-Lumacast-Executable=" + interpreter + "\n");
    EXPECT_EQ(disk.identifierOf(interpreter), std::nullopt);
}

TEST(LinuxBundles, TheUsersEntryCoversTheSystems) {
    Disk disk;
    const std::string mine = disk.installProgram("bin/mine");
    const std::string theirs = disk.installProgram("bin/theirs");
    disk.installEntry("home/applications/org.example.Player.desktop", "Name=Mine\nExec=mine\n");
    disk.installEntry("system/applications/org.example.Player.desktop", "Name=Theirs\nExec=theirs\n");
    EXPECT_EQ(disk.identifierOf(mine), kPlayer);
    EXPECT_EQ(disk.identifierOf(theirs), std::nullopt);
    EXPECT_EQ(disk.bundles().withIdentifier(kPlayer)->info(kInfoName), "Mine");
}

TEST(LinuxBundles, AHiddenEntryCoversTheSystemsToo) {
    Disk disk;
    const std::string program = disk.installProgram("bin/player");
    disk.installEntry("home/applications/org.example.Player.desktop", "Hidden=true\n");
    disk.installEntry("system/applications/org.example.Player.desktop", "Exec=player\n");
    EXPECT_EQ(disk.identifierOf(program), std::nullopt);
    EXPECT_FALSE(disk.bundles().withIdentifier(kPlayer));
}

TEST(LinuxBundles, AnEntryInAFolderHasItsNameInTheId) {
    Disk disk;
    const std::string program = disk.installProgram("bin/player");
    disk.installEntry("system/applications/vendor/player.desktop", "Exec=player\n");
    EXPECT_EQ(disk.identifierOf(program), BundleIdentifier("vendor-player"));
}

TEST(LinuxBundles, AnEntryAnybodyCouldHaveWrittenIsPassedOver) {
    Disk disk;
    const std::string program = disk.installProgram("bin/player");
    disk.installEntry("system/applications/org.example.Player.desktop", "Exec=player\n");
    fs::permissions(disk.scratch.path("system/applications/org.example.Player.desktop"), fs::perms(0666));
    EXPECT_EQ(disk.identifierOf(program), std::nullopt);
}

TEST(LinuxBundles, AnApplicationFolderIsFoundUpToThreeFoldersAbove) {
    Disk disk;
    disk.scratch.write("Player.app/manifest.json", R"({"identifier": "org.example.Player", "name": "Player"})");
    const std::string near = disk.installProgram("Player.app/player");
    const std::string far = disk.installProgram("Player.app/a/b/c/player");
    const std::string tooFar = disk.installProgram("Player.app/a/b/c/d/player");
    EXPECT_EQ(disk.bundles().bundlePathForExecutable(near), disk.scratch.path("Player.app"));
    EXPECT_EQ(disk.identifierOf(far), kPlayer);
    EXPECT_EQ(disk.identifierOf(tooFar), std::nullopt);
    EXPECT_EQ(disk.bundles().withIdentifier(kPlayer)->info(kInfoName), "Player");
}

TEST(LinuxBundles, AnInstalledApplicationFolderIsFoundByItsIdentifier) {
    Disk disk;
    disk.scratch.write("home/applications/Player.app/manifest.json",
                       R"({"identifier": "org.example.Player", "name": "Player", "name[de]": "Spieler"})");
    const auto bundle = disk.bundles().withIdentifier(kPlayer);
    ASSERT_TRUE(bundle);
    EXPECT_EQ(bundle->localizedInfo(kInfoDisplayName), "Spieler");
    EXPECT_EQ(bundle->resourcePath(), disk.scratch.path("home/applications/Player.app"));
}

TEST(LinuxBundles, WhatIsInstalledLaterIsSeen) {
    Disk disk;
    const std::string program = disk.installProgram("bin/player");
    EXPECT_EQ(disk.identifierOf(program), std::nullopt);
    disk.installEntry("system/applications/org.example.Player.desktop", "Name=One\nExec=player\n");
    EXPECT_EQ(disk.identifierOf(program), kPlayer);
    disk.installEntry("system/applications/org.example.Player.desktop", "Name=Another\nExec=player\n");
    EXPECT_EQ(disk.bundles().withIdentifier(kPlayer)->info(kInfoName), "Another");
    fs::remove(disk.scratch.path("system/applications/org.example.Player.desktop"));
    EXPECT_EQ(disk.identifierOf(program), std::nullopt);
    EXPECT_FALSE(disk.bundles().withIdentifier(kPlayer));
}

TEST(LinuxBundles, AHungDiskLeavesWhatWasKnown) {
    Disk disk;
    const std::string program = disk.installProgram("bin/player");
    disk.installEntry("system/applications/org.example.Player.desktop", "Name=Player\nExec=player\n");
    const auto hung = std::make_shared<std::atomic<bool>>(false);
    disk.options.beforeEachQuestion = [hung] {
        while (*hung) std::this_thread::yield();
    };
    disk.options.patience = std::chrono::milliseconds(500);
    ASSERT_EQ(disk.identifierOf(program), kPlayer);
    ASSERT_TRUE(disk.bundles().withIdentifier(kPlayer));
    *hung = true;
    EXPECT_EQ(disk.identifierOf(program), kPlayer);
    EXPECT_TRUE(disk.bundles().withIdentifier(kPlayer));
    EXPECT_FALSE(disk.bundles().withIdentifier(BundleIdentifier("org.example.Unknown")));
    EXPECT_EQ(disk.bundles().executablePath(ProcessID(::getpid())), std::nullopt);
    *hung = false;
}

TEST(LinuxBundles, WhatWasLookedUpLatelyIsAnsweredWithoutTheDisk) {
    Disk disk;
    const std::string program = disk.installProgram("bin/player");
    disk.installEntry("system/applications/org.example.Player.desktop", "Name=Player\nExec=player\n");
    const auto questions = std::make_shared<std::atomic<int>>(0);
    disk.options.beforeEachQuestion = [questions] { ++*questions; };
    disk.options.freshness = std::chrono::hours(1);
    const RunningProgram running(program);
    EXPECT_EQ(disk.bundles().executablePath(running.pid()), program);
    EXPECT_EQ(disk.identifierOf(program), kPlayer);
    const int asked = *questions;
    EXPECT_GE(asked, 3);
    for (int i = 0; i < 10; ++i) {
        EXPECT_EQ(disk.bundles().executablePath(running.pid()), program);
        EXPECT_EQ(disk.identifierOf(program), kPlayer);
    }
    EXPECT_EQ(*questions, asked);
    EXPECT_EQ(disk.identifierOf(disk.installProgram("bin/other")), std::nullopt);
    EXPECT_GT(*questions, asked) << "what is not known is looked up";
}

TEST(LinuxBundles, AProcessThatHasEndedIsForgottenAtOnce) {
    Disk disk;
    const std::string program = disk.installProgram("bin/player");
    disk.options.freshness = std::chrono::hours(1);
    std::optional<RunningProgram> running(program);
    const ProcessID pid = running->pid();
    EXPECT_EQ(disk.bundles().executablePath(pid), program);
    running.reset();
    EXPECT_EQ(disk.bundles().executablePath(pid), std::nullopt);
}

TEST(LinuxBundles, AProcessThatRunsAnotherProgramIsLookedUpAnew) {
    Disk disk;
    const std::string first = disk.installProgram("bin/first"), second = disk.installProgram("bin/second");
    disk.options.freshness = std::chrono::hours(1);
    int go[2];
    ASSERT_EQ(::pipe(go), 0);
    // The same program in two files would be one by its contents, not by its file.
    const pid_t pid = ::fork();
    if (pid == 0) {
        char byte = 0;
        if (::read(go[0], &byte, 1) != 1) ::_exit(1);
        ::execl(second.c_str(), second.c_str(), "1000", nullptr);
        ::_exit(1);
    }
    const auto before = disk.bundles().executablePath(ProcessID(pid));
    EXPECT_EQ(before, fs::read_symlink("/proc/self/exe").string());
    ASSERT_EQ(::write(go[1], "x", 1), 1);
    const auto limit = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (disk.bundles().executablePath(ProcessID(pid)) != second && std::chrono::steady_clock::now() < limit)
        std::this_thread::yield();
    EXPECT_EQ(disk.bundles().executablePath(ProcessID(pid)), second);
    ::kill(pid, SIGKILL);
    ::waitpid(pid, nullptr, 0);
    ::close(go[0]);
    ::close(go[1]);
}

TEST(LinuxBundles, WithoutFreshnessEveryLookIsAtTheDisk) {
    Disk disk;
    const std::string program = disk.installProgram("bin/player");
    const auto questions = std::make_shared<std::atomic<int>>(0);
    disk.options.beforeEachQuestion = [questions] { ++*questions; };
    disk.installEntry("system/applications/org.example.Player.desktop", "Exec=player\n");
    EXPECT_EQ(disk.identifierOf(program), kPlayer);
    const int asked = *questions;
    EXPECT_EQ(disk.identifierOf(program), kPlayer);
    EXPECT_EQ(*questions, 2 * asked);
}

TEST(ProcessImage, ARunningProgramHasItsPath) {
    const auto self = processImage(ProcessID(::getpid()));
    ASSERT_TRUE(self);
    EXPECT_EQ(self->path, fs::read_symlink("/proc/self/exe").string());
    EXPECT_FALSE(self->deleted);
}

TEST(ProcessImage, NobodyHasNoImage) {
    EXPECT_FALSE(processImage(ProcessID(0)));
    EXPECT_FALSE(processImage(ProcessID(-1)));
    EXPECT_FALSE(processImage(ProcessID(INT32_MAX)));
}

TEST(ProcessImage, AReplacedProgramKeepsItsPathAndIsMarked) {
    ScratchDirectory scratch;
    const std::string program = installExecutable(scratch.path("player"));
    const RunningProgram running(program);
    fs::remove(program);
    auto image = processImage(running.pid());
    ASSERT_TRUE(image);
    EXPECT_EQ(image->path, program);
    EXPECT_TRUE(image->deleted);
    installExecutable(program);
    image = processImage(running.pid());
    ASSERT_TRUE(image);
    EXPECT_EQ(image->path, program);
    EXPECT_TRUE(image->deleted);
}

TEST(ProcessImage, AFileThatIsGoneInOneFolderOnlyIsNotTheDeletedOneOfAnother) {
    ScratchDirectory scratch;
    const std::string program = installExecutable(scratch.path("player"));
    const RunningProgram running(program);
    fs::rename(program, scratch.path("player (deleted)"));
    // The same mark, but the file is still there: called something else.
    ASSERT_TRUE(processImage(running.pid()));
    fs::create_hard_link(scratch.path("player (deleted)"), scratch.path("kept"));
    fs::remove(scratch.path("player (deleted)"));
    EXPECT_FALSE(processImage(running.pid()));
    fs::remove(scratch.path("kept"));
    EXPECT_TRUE(processImage(running.pid())->deleted);
}

TEST(ProcessImage, AFileMayBeCalledDeleted) {
    ScratchDirectory scratch;
    const std::string program = installExecutable(scratch.path("player (deleted)"));
    const RunningProgram running(program);
    const auto image = processImage(running.pid());
    ASSERT_TRUE(image);
    EXPECT_EQ(image->path, program);
    EXPECT_FALSE(image->deleted);
}

struct Entitled : Disk {
    Entitled() {
        program = installProgram("bin/player");
        entry = scratch.path("system/applications/org.example.Player.desktop");
        installEntry("system/applications/org.example.Player.desktop", "Exec=player\n");
        dropIn =
            scratch.write("entitlements.d/50-player.conf", "[org.example.Player]\n" + std::string(kName) + "=true\n");
        running.emplace(program);
    }
    std::optional<Value> value(uid_t administrator = ::geteuid()) {
        Entitlements entitlements(bundles(),
                                  {{scratch.path("entitlements.d")}, administrator, std::chrono::seconds(30)});
        return entitlements.value(running->pid(), kName);
    }
    static constexpr const char* kName = "com.orvane.private.luma-cast";
    std::string program, entry, dropIn;
    std::optional<RunningProgram> running;
};

TEST(Entitlements, TheAdministratorsDropInCounts) {
    Entitled disk;
    EXPECT_EQ(disk.value(), Value(true));
}

TEST(Entitlements, AnotherNameOrApplicationHasNone) {
    Entitled disk;
    disk.scratch.write("entitlements.d/50-player.conf", "[org.example.Other]\ncom.orvane.private.luma-cast=true\n");
    EXPECT_EQ(disk.value(), std::nullopt);
    disk.scratch.write("entitlements.d/50-player.conf", "[org.example.Player]\ncom.orvane.private.other=true\n");
    EXPECT_EQ(disk.value(), std::nullopt);
}

TEST(Entitlements, ALaterDropInDecides) {
    Entitled disk;
    disk.scratch.write("entitlements.d/60-not.conf", "[org.example.Player]\ncom.orvane.private.luma-cast=false\n");
    EXPECT_EQ(disk.value(), Value(false));
    disk.scratch.write("entitlements.d/70-not-read.txt", "[org.example.Player]\ncom.orvane.private.luma-cast=true\n");
    EXPECT_EQ(disk.value(), Value(false));
}

TEST(Entitlements, WhatOthersCouldHaveWrittenDoesNotCount) {
    for (const std::string Entitled::*file : {&Entitled::program, &Entitled::entry, &Entitled::dropIn}) {
        Entitled disk;
        fs::permissions(disk.*file, fs::perms(0775));
        EXPECT_EQ(disk.value(), std::nullopt) << disk.*file;
        fs::permissions(disk.*file, fs::perms(0755));
        EXPECT_EQ(disk.value(), Value(true)) << disk.*file;
        const fs::path folder = fs::path(disk.*file).parent_path();
        fs::permissions(folder, fs::perms(0777));
        EXPECT_EQ(disk.value(), std::nullopt) << folder;
    }
}

TEST(Entitlements, AReplacedProgramLosesThem) {
    Entitled disk;
    fs::remove(disk.program);
    disk.installProgram("bin/player");
    EXPECT_EQ(disk.value(), std::nullopt);
}

TEST(Entitlements, WhatBelongsToSomebodyElseDoesNotCount) {
    Entitled disk;
    constexpr uid_t kSomebodyElse = 12345;
    // Only root may give a file away; for anybody else the administrator is another.
    if (::geteuid() == 0) {
        ASSERT_EQ(::chown(disk.entry.c_str(), kSomebodyElse, kSomebodyElse), 0);
        EXPECT_EQ(disk.value(), std::nullopt);
    } else {
        EXPECT_EQ(disk.value(kSomebodyElse), std::nullopt);
    }
}

TEST(Entitlements, AnExplanationSaysWhy) {
    Entitled disk;
    Entitlements entitlements(disk.bundles(),
                              {{disk.scratch.path("entitlements.d")}, ::geteuid(), std::chrono::seconds(30)});
    auto explanation = entitlements.explain(disk.running->pid());
    EXPECT_TRUE(explanation.counts);
    EXPECT_EQ(explanation.application, kPlayer);
    EXPECT_THAT(explanation.findings, ElementsAre("counted " + disk.dropIn));
    fs::permissions(disk.entry, fs::perms(0664));
    explanation = entitlements.explain(disk.running->pid());
    EXPECT_FALSE(explanation.counts);
    EXPECT_THAT(explanation.findings, ElementsAre("nothing counts: " + disk.entry + " may be written to by others"));
}

}  // namespace
}  // namespace lumacast
