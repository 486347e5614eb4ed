#pragma once
// The tool that records the whole display, installed as a privileged application on a machine of the test's own.

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "tests/sound/PrivateSoundServer.h"
#include "tests/system/World.h"

namespace lumacast::test {

class DisplayTool : public ::testing::Test {
protected:
    static constexpr char kIdentifier[] = "org.lumacast.lumacastctl";

    explicit DisplayTool(const std::string& screen = "1920x1080x24") : world_(World::Consent::Asked, screen) {
        world_.addVariable("PULSE_SERVER=" + sound_.address());
        world_.addVariable("DBUS_SESSION_BUS_ADDRESS=");
        world_.addVariable("XDG_CONFIG_DIRS=" + world_.path("system"));
        world_.addVariable("XDG_VIDEOS_DIR=" + world_.path("videos"));
        std::filesystem::copy_file(LC_CTL, world_.path("lumacastctl"));
        world_.install(kIdentifier, "Screen Recorder", world_.path("lumacastctl"));
        std::filesystem::create_directories(world_.path("system/lumacast/entitlements.d"));
    }
    void entitle() {
        std::ofstream(world_.path("system/lumacast/entitlements.d/lumacastctl.conf"))
            << "[" << kIdentifier << "]\ncom.orvane.private.luma-cast=true\n";
    }
    void askNobody() {
        std::ofstream(world_.path("config/lumacast/com.orvane.lumacastd.conf")) << "LCSuppressAlert=true\n";
    }
    std::unique_ptr<checkers::Child> tool(const std::vector<std::string>& options) {
        return run({"record", "--display"}, options);
    }
    std::unique_ptr<checkers::Child> run(const std::vector<std::string>& words,
                                         const std::vector<std::string>& options = {}) {
        std::vector<std::string> command{world_.path("lumacastctl")};
        command.insert(command.end(), words.begin(), words.end());
        command.insert(command.end(), options.begin(), options.end());
        return std::make_unique<checkers::Child>(command, world_.environment(), world_.path("tool.log"));
    }
    std::string complaints() const {
        std::ifstream file(world_.path("tool.log"));
        return {std::istreambuf_iterator<char>(file), {}};
    }
    double elapsed() {
        const auto current = world_.recording();
        return current.is_null() ? 0 : current["elapsedSeconds"].get<double>();
    }

    const PrivateSoundServer sound_;
    World world_;
};

}  // namespace lumacast::test
