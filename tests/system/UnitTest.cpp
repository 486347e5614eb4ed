// The shipped units, judged by the service manager's own tools. ConfinedTest.cpp runs the daemon under the system's one,
// scripts/test-packages under the users'.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <nlohmann/json.hpp>
#include <set>
#include <sstream>

#include "tests/checkers/tests/Child.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/system/Unit.h"

namespace lumacast::test {
namespace {

using checkers::Child;

/// The most exposed that the units may be, of 10. The analysis takes a unit of a user's manager for one that runs as the
/// administrator.
constexpr double kMostExposed = 2.5, kUsersMostExposed = 6.5;
constexpr char kOverall[] = "Overall exposure level for ";

/// A unit's file, with a program that is there.
class Unit : public ::testing::Test {
protected:
    Unit(const std::string& shipped, const std::string& name) : unit_(folder_.path() + "/" + name) {
        // Its own path may have a blank, which would end it in a unit.
        program_ = folder_.path() + "/lumacastd";
        std::filesystem::create_symlink(LC_DAEMON, program_);
        std::ofstream(unit_) << withAll(textOf(shipped), "/usr/bin/lumacastd", program_);
    }
    std::string analyze(std::vector<std::string> words) {
        words.insert(words.begin(), "systemd-analyze");
        words.push_back(unit_);
        // Manual pages are looked for by others.
        words.insert(words.begin() + 1, "--man=no");
        Child tool(words,
                   {"SYSTEMD_COLORS=0", "SYSTEMD_PAGER=cat", "LANG=C", "XDG_RUNTIME_DIR=" + folder_.path(),
                    "HOME=" + folder_.path()},
                   errors_);
        std::string printed = tool.readAll();
        status_ = tool.wait();
        return printed;
    }
    /// Held to `most` of 10, and packaging/README.md to it.
    void expectExposure(std::vector<std::string> words, double most) {
        const std::string printed = analyze(std::move(words));
        EXPECT_EQ(status_, 0) << textOf(errors_);
        const auto line = printed.find(kOverall);
        ASSERT_NE(line, std::string::npos) << printed;
        const auto colon = printed.find(": ", line);
        ASSERT_NE(colon, std::string::npos);
        const std::string figure = printed.substr(colon + 2, printed.find(' ', colon + 2) - colon - 2);
        EXPECT_LE(std::stod(figure), most) << printed;
        EXPECT_NE(textOf(packagingText()).find("**" + figure + "**"), std::string::npos)
            << "packaging/README.md names another figure than " << figure;
    }
    /// The names of what the unit leaves open.
    std::vector<std::string> leftOpen(std::vector<std::string> words) {
        const auto rows = nlohmann::json::parse(analyze(std::move(words)), nullptr, false);
        EXPECT_TRUE(rows.is_array()) << textOf(errors_);
        std::vector<std::string> names;
        for (const auto& row : rows)
            if (!row["exposure"].is_null()) names.push_back(row["name"]);
        return names;
    }
    static bool hasReason(const std::string& name) {
        static const std::string kReasons = withAll(textOf(packagingText()), "\\|", "|");
        return kReasons.find("`" + name + "`") != std::string::npos;
    }

    const ScratchDirectory folder_;
    const std::string unit_;
    std::string program_;
    const std::string errors_ = folder_.path() + "/errors.txt";
    int status_ = -1;
};

/// Of the system's manager: the instance for one user.
class ServiceUnit : public Unit {
protected:
    ServiceUnit() : Unit(shippedUnit(), "lumacastd@1000.service") {}
};

/// Of the users' own.
class UserUnits : public Unit {
protected:
    UserUnits() : Unit(shippedUserUnits() + "lumacastd.service", "lumacastd.service") {
        std::filesystem::copy_file(shippedUserUnits() + "lumacastd.socket", folder_.path() + "/lumacastd.socket");
    }
};

TEST_F(ServiceUnit, IsUnderstoodByTheServiceManagerToTheLastWord) {
    EXPECT_EQ(analyze({"verify"}), "");
    EXPECT_EQ(textOf(errors_), "");
    EXPECT_EQ(status_, 0);
}

TEST_F(ServiceUnit, LeavesLittleExposedAndTheDocumentsSayHowMuch) {
    expectExposure({"security", "--offline=true", "--no-pager"}, kMostExposed);
}

TEST_F(ServiceUnit, HasAReasonForEverythingThatItLeavesOpen) {
    const auto open = leftOpen({"security", "--offline=true", "--json=short"});
    for (const std::string& name : open)
        EXPECT_TRUE(hasReason(name)) << name << " is open and packaging/README.md doesn't say why";
    EXPECT_GT(open.size(), 5u);
    EXPECT_LT(open.size(), 20u);
}

TEST_F(UserUnits, AreUnderstoodByTheServiceManagerToTheLastWord) {
    EXPECT_EQ(analyze({"--user", "verify", folder_.path() + "/lumacastd.socket"}), "");
    EXPECT_EQ(textOf(errors_), "");
    EXPECT_EQ(status_, 0);
}

TEST_F(UserUnits, LeaveNoMoreExposedThanTheDocumentsSay) {
    expectExposure({"--user", "security", "--offline=true", "--no-pager"}, kUsersMostExposed);
}

TEST_F(UserUnits, HaveAReasonForEverythingThatTheyLeaveOpen) {
    for (const std::string& name : leftOpen({"--user", "security", "--offline=true", "--json=short"}))
        EXPECT_TRUE(name.starts_with("CapabilityBoundingSet=") || hasReason(name))
            << name << " is open and packaging/README.md doesn't say why";
}

TEST_F(UserUnits, ConfineAsTheSystemsUnitDoesWhereAUsersManagerCan) {
    const auto restrictions = [](const std::string& file) {
        std::set<std::string> lines;
        std::istringstream text(textOf(file));
        for (std::string line; std::getline(text, line);)
            for (const char* name : {"SystemCall", "Restrict", "Lock", "MemoryDeny", "NoNew", "Limit", "UMask", "Keyring"})
                if (line.starts_with(name)) lines.insert(line);
        return lines;
    };
    EXPECT_EQ(restrictions(shippedUserUnits() + "lumacastd.service"), restrictions(shippedUnit()));
    EXPECT_GT(restrictions(shippedUnit()).size(), 12u);
}

TEST_F(UserUnits, StayAwayWhereTheSystemsUnitIsEnabledForTheUser) {
    // What `systemctl enable lumacastd@1000` makes.
    EXPECT_THAT(textOf(shippedUnit()), ::testing::HasSubstr("\nWantedBy=user@%i.service\n"));
    const std::string condition =
        "ConditionPathExists=!/etc/systemd/system/user@%U.service.wants/lumacastd@%U.service\n";
    EXPECT_THAT(textOf(shippedUserUnits() + "lumacastd.service"), ::testing::HasSubstr("\n" + condition));
    EXPECT_THAT(textOf(shippedUserUnits() + "lumacastd.socket"), ::testing::HasSubstr("\n" + condition));
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
