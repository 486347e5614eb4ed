#include "tests/system/DaemonUser.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>

#include "linux/admin/LinuxAdminService.h"
#include "tests/client/WaitUntil.h"

namespace lumacast::test {

namespace fs = std::filesystem;

DaemonUser::DaemonUser() {
    EXPECT_FALSE(folder_.path().empty()) << "no temporary folder";
    for (const auto& [variable, name] : {std::pair{"XDG_RUNTIME_DIR", "run"},
                                         {"XDG_CONFIG_HOME", "config"},
                                         {"XDG_DATA_HOME", "data"},
                                         {"XDG_STATE_HOME", "state"},
                                         {"XDG_CACHE_HOME", "cache"}}) {
        fs::create_directory(path(name));
        fs::permissions(path(name), fs::perms::owner_all);
        addVariable(std::string(variable) + "=" + path(name));
    }
    fs::create_directories(path("config/lumacast"));
    fs::create_directories(path("data/applications"));
    fs::create_directories(path("data/lumacast"));
    fs::copy(fs::path(LC_SOURCE_DIR) / "resources/Lumacast.bundle", path("data/lumacast/Lumacast.bundle"),
             fs::copy_options::recursive);
}

DaemonUser::~DaemonUser() {
    if (::testing::Test::HasFailure()) std::fprintf(stderr, "%s\n", daemonLog().c_str());
}

void DaemonUser::install(const std::string& identifier, const std::string& name, const std::string& executable) const {
    std::ofstream(path("data/applications/" + identifier + ".desktop"))
        << "[Desktop Entry]\nType=Application\nName=" << name << "\nExec=\"" << executable << "\"\n";
}

void DaemonUser::startDaemon(const std::vector<std::string>& command, const std::vector<std::string>& variables) {
    std::vector<std::string> environment = environment_;
    environment.insert(environment.end(), variables.begin(), variables.end());
    daemon_ = std::make_unique<checkers::Child>(command, environment, path("daemon.log"));
    EXPECT_TRUE(waitUntil([this] { return !status().is_null(); })) << daemonLog();
}

nlohmann::json DaemonUser::status() const {
    const auto answer = askAdminService(path("run/lumacast/admin.sock"), "status", std::chrono::milliseconds(5000));
    return answer ? nlohmann::json::parse(*answer, nullptr, false) : nlohmann::json();
}

}  // namespace lumacast::test
