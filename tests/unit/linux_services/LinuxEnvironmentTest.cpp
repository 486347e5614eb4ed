#include "linux/system/LinuxEnvironment.h"

#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include <map>

#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/linux_services/ModeOf.h"

namespace lumacast {
namespace {

using testing::ElementsAre;

LinuxEnvironment from(std::map<std::string, std::string, std::less<>> variables, const std::string& executable = "",
                      const std::string& systemDirectory = "/nonexistent/lumacast") {
    const auto variable = [variables](std::string_view name) -> std::optional<std::string> {
        const auto found = variables.find(name);
        return found == variables.end() ? std::nullopt : std::optional(found->second);
    };
    return LinuxEnvironment::from(variable, 1234, executable, systemDirectory);
}

TEST(LinuxEnvironment, WithoutVariablesTheUsualPlacesCount) {
    const auto environment = from({{"HOME", "/home/u"}});
    EXPECT_EQ(environment.runtimeDirectory, "/run/user/1234/lumacast");
    EXPECT_EQ(environment.stateDirectory, "/home/u/.local/state/lumacast");
    EXPECT_EQ(environment.cacheDirectory, "/home/u/.cache/lumacast");
    EXPECT_EQ(environment.root, "/home/u/.local/state/lumacast/root");
    EXPECT_THAT(environment.configDirectories, ElementsAre("/home/u/.config", "/etc/xdg"));
    EXPECT_THAT(environment.dataDirectories, ElementsAre("/home/u/.local/share", "/usr/local/share", "/usr/share"));
    EXPECT_THAT(environment.systemDirectories, ElementsAre("/nonexistent/lumacast", "/etc/xdg/lumacast"));
    EXPECT_EQ(environment.resourceBundle, "/usr/share/lumacast/Lumacast.bundle");
}

TEST(LinuxEnvironment, TheXdgVariablesDecide) {
    const auto environment = from({{"HOME", "/home/u"},
                                   {"XDG_RUNTIME_DIR", "/r/"},
                                   {"XDG_CONFIG_HOME", "/c"},
                                   {"XDG_CONFIG_DIRS", "/c1:/c2/"},
                                   {"XDG_DATA_HOME", "/d"},
                                   {"XDG_DATA_DIRS", "/d1:relative::/d2"},
                                   {"XDG_STATE_HOME", "/s"},
                                   {"XDG_CACHE_HOME", "/k"}});
    EXPECT_EQ(environment.runtimeDirectory, "/r/lumacast");
    EXPECT_EQ(environment.stateDirectory, "/s/lumacast");
    EXPECT_EQ(environment.cacheDirectory, "/k/lumacast");
    EXPECT_EQ(environment.root, "/s/lumacast/root");
    EXPECT_THAT(environment.configDirectories, ElementsAre("/c", "/c1", "/c2"));
    EXPECT_THAT(environment.dataDirectories, ElementsAre("/d", "/d1", "/d2"));
}

TEST(LinuxEnvironment, ARelativePathIsIgnored) {
    const auto environment = from({{"HOME", "/home/u"}, {"XDG_STATE_HOME", "state"}, {"XDG_RUNTIME_DIR", ""}});
    EXPECT_EQ(environment.stateDirectory, "/home/u/.local/state/lumacast");
    EXPECT_EQ(environment.runtimeDirectory, "/run/user/1234/lumacast");
}

TEST(LinuxEnvironment, TheAdministratorMayPutTheRootElsewhere) {
    ScratchDirectory scratch;
    const std::string file = scratch.write("daemon.conf", "Root=/srv/recordings/\n");
    EXPECT_EQ(from({{"HOME", "/home/u"}}, "", scratch.path()).root, "/srv/recordings");
    scratch.write("daemon.conf", "Root=/\n");
    EXPECT_EQ(from({{"HOME", "/home/u"}}, "", scratch.path()).root, "");
    scratch.write("daemon.conf", "Root=relative\n");
    EXPECT_EQ(from({{"HOME", "/home/u"}}, "", scratch.path()).root, "/home/u/.local/state/lumacast/root");
}

TEST(LinuxEnvironment, TheResourcesAreTheUsersTheSystemsOrTheInstallations) {
    ScratchDirectory scratch;
    const std::map<std::string, std::string, std::less<>> variables{
        {"HOME", scratch.path("home")}, {"XDG_DATA_DIRS", scratch.path("data")}};
    const std::string executable = scratch.path("prefix/bin/lumacastd");
    scratch.makeDirectory("prefix/share/lumacast/Lumacast.bundle");
    EXPECT_EQ(from(variables, executable).resourceBundle, scratch.path("prefix/share/lumacast/Lumacast.bundle"));
    scratch.makeDirectory("data/lumacast/Lumacast.bundle");
    EXPECT_EQ(from(variables, executable).resourceBundle, scratch.path("data/lumacast/Lumacast.bundle"));
    scratch.makeDirectory("home/.local/share/lumacast/Lumacast.bundle");
    EXPECT_EQ(from(variables, executable).resourceBundle, scratch.path("home/.local/share/lumacast/Lumacast.bundle"));
}

TEST(LinuxEnvironment, TheFirstLocaleThatIsSetIsTheUsers) {
    EXPECT_EQ(from({{"LANG", "de"}, {"LC_MESSAGES", "fr"}}).messageLocale, "fr");
    EXPECT_EQ(from({{"LANG", "de"}, {"LC_MESSAGES", "fr"}, {"LC_ALL", "it"}}).messageLocale, "it");
    EXPECT_EQ(from({{"LANG", "de"}, {"LC_ALL", ""}}).messageLocale, "de");
}

TEST(LinuxEnvironment, ItsDirectoriesAreThisUsersAlone) {
    ScratchDirectory scratch;
    auto environment = from({{"HOME", scratch.path("home")}, {"XDG_RUNTIME_DIR", scratch.path("run")}});
    EXPECT_FALSE(environment.prepareDirectories());
    EXPECT_FALSE(environment.prepareDirectories()) << "a second start";
    for (const std::string& path :
         {environment.runtimeDirectory, environment.stateDirectory, environment.cacheDirectory})
        EXPECT_EQ(modeOf(path), 0700u) << path;
}

TEST(LinuxEnvironment, ADirectoryOthersMayWriteToIsRefused) {
    ScratchDirectory scratch;
    auto environment = from({{"HOME", scratch.path("home")}, {"XDG_RUNTIME_DIR", scratch.path("run")}});
    scratch.makeDirectory("run/lumacast");
    std::filesystem::permissions(scratch.path("run/lumacast"), std::filesystem::perms(0777));
    const auto bad = environment.prepareDirectories();
    ASSERT_TRUE(bad);
    EXPECT_EQ(bad->path, scratch.path("run/lumacast"));
    EXPECT_EQ(bad->why, "it is not this user's own, or others may write to it");
}

TEST(LinuxEnvironment, OfADirectoryThatCannotBeMadeItSaysWhichAndWhy) {
    ScratchDirectory scratch;
    scratch.makeDirectory("home");
    scratch.write("home/.cache", "a file in its way");
    const auto environment = from({{"HOME", scratch.path("home")}, {"XDG_RUNTIME_DIR", scratch.path("run")}});
    const auto bad = environment.prepareDirectories();
    ASSERT_TRUE(bad);
    EXPECT_EQ(bad->path, scratch.path("home/.cache/lumacast"));
    EXPECT_EQ(bad->why, std::generic_category().message(ENOTDIR));
}

TEST(LinuxEnvironment, ALinkInTheDirectorysPlaceIsRefused) {
    ScratchDirectory scratch;
    auto environment = from({{"HOME", scratch.path("home")}, {"XDG_RUNTIME_DIR", scratch.path("run")}});
    scratch.makeDirectory("run");
    std::filesystem::create_symlink(scratch.makeDirectory("elsewhere"), scratch.path("run/lumacast"));
    EXPECT_TRUE(environment.prepareDirectories());
}

}  // namespace
}  // namespace lumacast
