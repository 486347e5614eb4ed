#include "linux/system/LinuxPreferences.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "linux/system/LinuxDeviceInfo.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/linux_services/Until.h"

namespace lumacast {
namespace {

TEST(LinuxPreferences, TheUsersFileGoesBeforeTheAdministrators) {
    ScratchDirectory scratch;
    scratch.write("user/lumacast/d.conf", "A=1\n");
    scratch.write("system/lumacast/d.conf", "A=2\nB=3\n");
    const LinuxPreferences preferences({scratch.path("user"), scratch.path("system")}, kPatience);
    EXPECT_EQ(preferences.value("d", "A"), Value(std::int64_t{1}));
    EXPECT_EQ(preferences.value("d", "B"), Value(std::int64_t{3}));
}

TEST(LinuxPreferences, AFileTooLargeCountsAsMissing) {
    ScratchDirectory scratch;
    const LinuxPreferences preferences({scratch.path()}, kPatience);
    scratch.write("lumacast/d.conf", "A=1\n" + std::string(64 * 1024 - 4, '#'));
    EXPECT_EQ(preferences.value("d", "A"), Value(std::int64_t{1}));
    scratch.write("lumacast/d.conf", "A=1\n" + std::string(64 * 1024 - 3, '#'));
    EXPECT_EQ(preferences.value("d", "A"), std::nullopt);
}

TEST(LinuxPreferences, APipeInTheFilesPlaceIsNotWaitedFor) {
    ScratchDirectory scratch;
    scratch.makeDirectory("lumacast");
    ASSERT_EQ(::mkfifo(scratch.path("lumacast/d.conf").c_str(), 0600), 0);
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_EQ(LinuxPreferences({scratch.path()}, kPatience).value("d", "A"), std::nullopt);
    EXPECT_LT(std::chrono::steady_clock::now() - begin, kPatience);
}

TEST(LinuxPreferences, ADomainIsNoPath) {
    ScratchDirectory scratch;
    scratch.makeDirectory("lumacast");
    scratch.write("secret.conf", "A=1\n");
    const LinuxPreferences preferences({scratch.path()}, kPatience);
    EXPECT_EQ(preferences.value("../secret", "A"), std::nullopt);
    scratch.write("lumacast/sub/d.conf", "A=1\n");
    EXPECT_EQ(preferences.value("sub/d", "A"), std::nullopt);
}

TEST(LinuxDeviceInfo, ANumberThatIsNoneIsNoAnswer) {
    ScratchDirectory scratch;
    scratch.write("device.conf", "Idiom=tablet\nChipID=12x\nReducedCaptureChipID=99999999999999999999\n");
    const LinuxDeviceInfo device({scratch.path()}, kPatience);
    EXPECT_EQ(device.userInterfaceIdiom(), std::nullopt);
    EXPECT_EQ(device.chipID(), std::nullopt);
    EXPECT_EQ(device.reducedCaptureChipID(), std::nullopt);
}

}  // namespace
}  // namespace lumacast
