// The headless port's daemon, with no display and no sound server anywhere near.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>
#include <string>
#include <vector>

#include "tests/checkers/check_movie/MovieCheck.h"
#include "tests/system/DaemonUser.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::Not;

/// What `command` prints; fails the test when it fails.
std::string outputOf(const std::string& command) {
    std::string output;
    FILE* const pipe = ::popen(command.c_str(), "r");
    if (!pipe) return output;
    char buffer[4096];
    while (const std::size_t length = std::fread(buffer, 1, sizeof buffer, pipe)) output.append(buffer, length);
    EXPECT_EQ(::pclose(pipe), 0) << command << "\n" << output;
    return output;
}

std::string bytesOf(const std::string& path) { return ScratchDirectory::read(path); }

/// A user of a machine with nothing on it but one application.
class Headless : public ::testing::Test {
protected:
    Headless() { user_.install("org.lumacast.Minimal", "Minimal", LC_MINIMAL_HEADLESS); }

    /// `consent` is the variable that answers every question; without it, as the port has it.
    void startDaemon(const std::string& consent = {}) {
        std::vector<std::string> variables;
        if (!consent.empty()) variables.push_back("LUMACAST_HEADLESS_CONSENT=" + consent);
        user_.startDaemon(withoutADesktop(LC_HEADLESS_DAEMON), variables);
    }
    /// The application's exit status.
    int record() {
        std::vector<std::string> command = withoutADesktop(LC_MINIMAL_HEADLESS);
        command.push_back(movie());
        return checkers::Child(command, user_.environment(), path("application.log")).wait();
    }
    std::string movie() const { return path("movie.mp4"); }
    std::string path(const std::string& name) const { return user_.path(name); }

private:
    static std::vector<std::string> withoutADesktop(const char* program) {
        return {"env", "-u", "DISPLAY", "-u", "WAYLAND_DISPLAY", "-u", "PULSE_SERVER", "-u", "DBUS_SESSION_BUS_ADDRESS", program};
    }

    DaemonUser user_;
};

TEST_F(Headless, RecordsTheSceneWithItsTonesInTimeWithItsBorders) {
    startDaemon("allow");
    ASSERT_EQ(record(), 0) << bytesOf(path("application.log"));
    checkers::MovieCheckOptions options;
    options.movie = movie();
    options.leastSeconds = 2.5;
    options.audioTracks = options.videoTracks = 1;
#ifndef LC_SANITIZED  // which may be too slow for every picture, but not out of time
    options.frames.withoutGaps = true;
#endif
    options.beepsAtMarks = 1000;
    options.sync.leastPairs = 4;
    const auto result = checkers::checkMovie(options);
    for (const auto& finding : result.findings) ADD_FAILURE() << finding;
    EXPECT_TRUE(result.readable);
    EXPECT_THAT(bytesOf(path("daemon.log")), HasSubstr("allowed by configuration"));
}

TEST_F(Headless, RefusesEveryRecordingThatNobodyAllowed) {
    startDaemon();
    EXPECT_EQ(record(), 1);
    EXPECT_THAT(bytesOf(path("application.log")), HasSubstr("not started"));
    EXPECT_THAT(bytesOf(path("daemon.log")), HasSubstr("refused by configuration"));
    EXPECT_FALSE(fs::exists(movie()));
}

TEST_F(Headless, LinksNoDisplayAndNoSoundServer) {
    for (const char* library : {"libxcb", "libpulse"}) {
        EXPECT_THAT(outputOf(std::string("readelf -d ") + LC_HEADLESS_DAEMON),
                    Not(HasSubstr(std::string("[") + library)));
        EXPECT_THAT(outputOf(std::string("readelf -d ") + LC_DAEMON), HasSubstr(std::string("[") + library))
            << "so that it can fail";
    }
}

TEST_F(Headless, ConsentByConfigurationIsNothingTheOtherDaemonKnowsOf) {
    ASSERT_THAT(bytesOf(LC_DAEMON), HasSubstr("lumacastd Starting!")) << "so that it is what is looked through";
    for (const char* text : {"LUMACAST_HEADLESS_CONSENT", "allowed by configuration"}) {
        EXPECT_THAT(bytesOf(LC_HEADLESS_DAEMON), HasSubstr(text));
        EXPECT_EQ(bytesOf(LC_DAEMON).find(text), std::string::npos);
    }
}

TEST_F(Headless, IsConfiguredOnAMachineWithoutTheLibrariesOfADesktop) {
    // Every package this machine has, but those.
    const fs::path packages = path("packages");
    fs::create_directory(packages);
    std::size_t left = 0;
    std::string folders = outputOf("pkg-config --variable pc_path pkg-config");
    for (char& letter : folders) letter = letter == ':' || letter == '\n' ? ' ' : letter;
    for (const std::string& name : {std::string("*.pc")})
        outputOf("for f in $(find " + folders + " -name '" + name + "' 2>/dev/null); do ln -sf $f " +
                 packages.string() + "/; done");
    for (const auto& entry : fs::directory_iterator(packages)) {
        const std::string name = entry.path().filename().string();
        if (!name.starts_with("xcb") && !name.starts_with("libpulse") && !name.starts_with("x11")) continue;
        fs::remove(entry.path());
        ++left;
    }
    EXPECT_GT(left, 2u) << "so that there was something to leave out";
    const std::string configure =
        "PKG_CONFIG_PATH= PKG_CONFIG_LIBDIR=" + packages.string() + " cmake -S " LC_SOURCE_DIR " -B ";
    EXPECT_THAT(outputOf(configure + path("headless") + " -DLUMACAST_PORT=headless 2>&1"),
                HasSubstr("Generating done"));
    EXPECT_THAT(outputOf("! " + configure + path("linux") + " -DLUMACAST_PORT=linux 2>&1"), HasSubstr("xcb"))
        << "so that it can fail";
}

}  // namespace
}  // namespace lumacast::test
