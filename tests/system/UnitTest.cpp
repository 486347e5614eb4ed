// The shipped service unit, judged by the service manager's own tools. ConfinedTest.cpp runs the daemon under it.

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <nlohmann/json.hpp>

#include "tests/checkers/tests/Child.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/system/Unit.h"

namespace lumacast::test {
namespace {

using checkers::Child;

/// The most exposed that the unit may be, of 10.
constexpr double kMostExposed = 2.5;
constexpr char kOverall[] = "Overall exposure level for ";

class ServiceUnit : public ::testing::Test {
protected:
    /// Of the instance for one user, with a program that is there.
    ServiceUnit() {
        // Its own path may have a blank, which would end it in a unit.
        const std::string program = folder_.path() + "/lumacastd";
        std::filesystem::create_symlink(LC_DAEMON, program);
        std::ofstream(instance_) << withAll(textOf(shippedUnit()), "/usr/bin/lumacastd", program);
    }
    std::string analyze(std::vector<std::string> words) {
        words.insert(words.begin(), "systemd-analyze");
        words.push_back(instance_);
        Child tool(words, {"SYSTEMD_COLORS=0", "SYSTEMD_PAGER=cat", "LANG=C"}, errors_);
        std::string printed = tool.readAll();
        status_ = tool.wait();
        return printed;
    }

    const ScratchDirectory folder_;
    const std::string instance_ = folder_.path() + "/lumacastd@1000.service";
    const std::string errors_ = folder_.path() + "/errors.txt";
    int status_ = -1;
};

TEST_F(ServiceUnit, IsUnderstoodByTheServiceManagerToTheLastWord) {
    EXPECT_EQ(analyze({"verify"}), "");
    EXPECT_EQ(textOf(errors_), "");
    EXPECT_EQ(status_, 0);
}

TEST_F(ServiceUnit, LeavesLittleExposedAndTheDocumentsSayHowMuch) {
    const std::string printed = analyze({"security", "--offline=true", "--no-pager"});
    EXPECT_EQ(status_, 0) << textOf(errors_);
    const auto line = printed.find(kOverall);
    ASSERT_NE(line, std::string::npos) << printed;
    const auto colon = printed.find(": ", line);
    ASSERT_NE(colon, std::string::npos);
    const std::string figure = printed.substr(colon + 2, printed.find(' ', colon + 2) - colon - 2);
    EXPECT_LE(std::stod(figure), kMostExposed) << printed;
    EXPECT_NE(textOf(packagingText()).find("**" + figure + "**"), std::string::npos)
        << "packaging/README.md names another figure than " << figure;
}

TEST_F(ServiceUnit, HasAReasonForEverythingThatItLeavesOpen) {
    const auto rows = nlohmann::json::parse(analyze({"security", "--offline=true", "--json=short"}), nullptr, false);
    ASSERT_TRUE(rows.is_array()) << textOf(errors_);
    const std::string reasons = withAll(textOf(packagingText()), "\\|", "|");
    int open = 0;
    for (const auto& row : rows) {
        if (row["exposure"].is_null()) continue;
        ++open;
        EXPECT_NE(reasons.find("`" + row["name"].get<std::string>() + "`"), std::string::npos)
            << row["name"] << " is open and packaging/README.md doesn't say why";
    }
    EXPECT_GT(open, 5);
    EXPECT_LT(open, 20);
}

TEST_F(ServiceUnit, AUserNamespaceWouldHideWhoTheClientsAre) {
    // Which is why the unit is none of the user's own service manager. The same user's process, looked at from inside.
    enum Seen { Hidden = 10, Visible, NoNamespaces };
    const std::string program = "/proc/" + std::to_string(::getpid()) + "/exe";
    std::array<char, 4096> path{};
    ASSERT_GT(::readlink(program.c_str(), path.data(), path.size()), 0);
    const pid_t inside = ::fork();
    if (inside == 0) {
        if (::unshare(CLONE_NEWUSER) != 0) ::_exit(NoNamespaces);
        ::_exit(::readlink(program.c_str(), path.data(), path.size()) < 0 && errno == EACCES ? Hidden : Visible);
    }
    ASSERT_GT(inside, 1);
    int status = 0;
    ASSERT_EQ(::waitpid(inside, &status, 0), inside);
    ASSERT_TRUE(WIFEXITED(status));
    if (WEXITSTATUS(status) == NoNamespaces) std::printf("    this machine allows no user namespaces at all\n");
    EXPECT_NE(WEXITSTATUS(status), Visible);
}

}  // namespace
}  // namespace lumacast::test
