// What is installed without packages lies where it is looked for.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <string>

#include "tests/contract/ScratchDirectory.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;

TEST(Installation, OfTheOrdinaryBuildPutsEverythingWhereTheDaemonAndApplicationsLook) {
    const ScratchDirectory scratch;
    const std::string log = scratch.path("log");
    const std::string command =
        "DESTDIR='" + scratch.path() + "' cmake --install '" LC_BINARY_DIR "' >'" + log + "' 2>&1";
    ASSERT_EQ(std::system(command.c_str()), 0) << ScratchDirectory::read(log);
    for (const char* path :
         {"etc/lumacast/entitlements.d/lumacastctl.conf", "usr/bin/lumacastd", "usr/bin/lumacastctl",
          "usr/libexec/lumacast/lumacast-extension-launcher", "usr/share/lumacast/Lumacast.bundle/manifest.json",
          "usr/share/lumacast/extensions/hls-clips/manifest.json", "usr/lib/systemd/user/lumacastd.socket",
          "usr/lib/systemd/system/lumacastd@.service", "usr/include/lumacast/client/Recorder.h"})
        EXPECT_TRUE(fs::exists(scratch.path(path))) << path;
    std::string named;
    for (const auto& entry : fs::recursive_directory_iterator(scratch.path("usr")))
        if (entry.path().filename() == "lumacast.pc") named = ScratchDirectory::read(entry.path());
    EXPECT_THAT(named, ::testing::StartsWith("prefix=/usr\n"));
}

}  // namespace
}  // namespace lumacast::test
