#include "client/lumacastctl/doctor/Identity.h"

#include <unistd.h>

#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/linux_apps/RunningProgram.h"
#include "tests/unit/lumacastctl/FindingMatchers.h"

namespace lumacast::ctl {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::Not;

// --- the checks ---

IdentityFacts playersProcess() {
    IdentityFacts facts;
    facts.question.pid = ProcessID{42};
    facts.executable = "/opt/player";
    facts.bundlePath = "/share/applications/org.example.Player.desktop";
    facts.identifier = "org.example.Player";
    facts.name = "Player";
    facts.applicationDirectories = {"/home/share/applications", "/share/applications"};
    return facts;
}

TEST(IdentityCheck, TellsTheApplicationAndWhatMakesItOne) {
    EXPECT_THAT(checkIdentity(playersProcess()),
                ElementsAre(Finds(kOk, "process 42 (/opt/player) is org.example.Player (\"Player\"), by "
                                       "/share/applications/org.example.Player.desktop.")));
}

TEST(IdentityCheck, OfAProgramNamesNoProcess) {
    IdentityFacts facts = playersProcess();
    facts.question = {std::nullopt, "player"};
    EXPECT_THAT(checkIdentity(facts), ElementsAre(Finds(kOk, "/opt/player is org.example.Player")));
}

TEST(IdentityCheck, WithoutAnApplicationIsAProblemForWhoeverIsAskedAbout) {
    IdentityFacts facts = playersProcess();
    facts.identifier = facts.bundlePath = std::nullopt;
    EXPECT_THAT(checkIdentity(facts),
                ElementsAre(Finds(kProblem, "process 42 (/opt/player) belongs to no application")));
    EXPECT_THAT(checkIdentity(facts), ElementsAre(Finds(kProblem, "into /home/share/applications whose Exec")));
}

TEST(IdentityCheck, WithoutAnApplicationIsWellForWhoeverCalledTheTool) {
    IdentityFacts facts = playersProcess();
    facts.identifier = facts.bundlePath = std::nullopt;
    facts.question.isExample = true;
    EXPECT_THAT(checkIdentity(facts),
                ElementsAre(Finds(kOk, "which started this tool, belongs to no application"),
                            Finds(kOk, "a desktop entry in /home/share/applications, /share/applications")));
}

TEST(IdentityCheck, OfNothingThatRunsIsAProblemForWhoeverIsAskedAbout) {
    IdentityFacts facts;
    facts.question.pid = ProcessID{42};
    EXPECT_THAT(checkIdentity(facts), ElementsAre(Finds(kProblem, "process 42 is not there")));
    facts.question = {std::nullopt, "/no/such"};
    EXPECT_THAT(checkIdentity(facts), ElementsAre(Finds(kProblem, "\"/no/such\" is no program")));
    facts.question = {ProcessID{42}, std::nullopt, true};
    EXPECT_FALSE(hasProblem(checkIdentity(facts)));
}

EntitlementFacts playersEntitlements() {
    EntitlementFacts facts;
    facts.directories = {"/etc/entitlements.d"};
    facts.explanation.emplace();
    facts.explanation->application = BundleIdentifier("org.example.Player");
    facts.explanation->counts = true;
    return facts;
}

TEST(EntitlementCheck, TellsWhatAnApplicationHas) {
    EntitlementFacts facts = playersEntitlements();
    facts.explanation->entitlements = {{"com.orvane.private.luma-cast", true}, {"other", "text"}};
    EXPECT_THAT(
        checkEntitlements(facts),
        ElementsAre(Finds(kOk, "org.example.Player has com.orvane.private.luma-cast = true, other = \"text\".")));
}

TEST(EntitlementCheck, SaysWhereItLookedInVain) {
    EXPECT_THAT(checkEntitlements(playersEntitlements()),
                ElementsAre(Finds(kOk, "looked for *.conf in /etc/entitlements.d")));
}

TEST(EntitlementCheck, SaysWhyNoneCanCount) {
    EntitlementFacts facts = playersEntitlements();
    facts.explanation->counts = false;
    facts.explanation->findings = {"nothing counts: /home belongs to somebody else"};
    EXPECT_THAT(checkEntitlements(facts),
                ElementsAre(Finds(
                    kOk, "none can count for org.example.Player (nothing counts: /home belongs to somebody else)")));
}

TEST(EntitlementCheck, WarnsOfDropInsThatArePassedOver) {
    EntitlementFacts facts = playersEntitlements();
    facts.explanation->findings = {"counted /etc/a.conf", "passed over /etc/b.conf: it may be written to by others"};
    EXPECT_THAT(checkEntitlements(facts), Contains(Finds(kWarning, "passed over /etc/b.conf")).Times(1));
    EXPECT_THAT(checkEntitlements(facts), Contains(Finds(kWarning, "")).Times(1));
}

TEST(EntitlementCheck, IsWellWithoutAProcessOrAnApplication) {
    EXPECT_THAT(checkEntitlements({}), ElementsAre(Finds(kOk, "for a running process only")));
    EntitlementFacts facts = playersEntitlements();
    facts.explanation->application = std::nullopt;
    EXPECT_THAT(checkEntitlements(facts), ElementsAre(Finds(kOk, "none, without an application")));
}

// --- the probes, on real programs ---

class IdentityProbe : public ::testing::Test {
protected:
    IdentityProbe() : program_(installExecutable(scratch_.path("bin/player"))) {
        scratch_.write("data/applications/org.example.Player.desktop",
                       "[Desktop Entry]\nType=Application\nName=Player\nExec=" + program_ + "\n");
        options_.applicationDirectories = {scratch_.path("data/applications")};
        options_.patience = std::chrono::seconds(20);
    }
    IdentityFacts identityOf(const IdentityQuestion& question) {
        LinuxBundles bundles(options_);
        return probeIdentity(bundles, options_, question);
    }

    ScratchDirectory scratch_;
    const std::string program_;
    LinuxBundles::Options options_;
};

TEST_F(IdentityProbe, FindsTheApplicationOfAProcess) {
    const RunningProgram player(program_);
    const IdentityFacts facts = identityOf({.pid = player.pid()});
    EXPECT_EQ(facts.executable, program_);
    EXPECT_EQ(facts.identifier, "org.example.Player");
    EXPECT_EQ(facts.bundlePath, scratch_.path("data/applications/org.example.Player.desktop"));
    EXPECT_EQ(facts.name, "Player");
}

TEST_F(IdentityProbe, FindsTheApplicationOfAProgramThroughLinks) {
    std::filesystem::create_symlink(program_, scratch_.path("link"));
    const IdentityFacts facts = identityOf({.pid = {}, .executable = scratch_.path("link")});
    EXPECT_EQ(facts.executable, program_);
    EXPECT_EQ(facts.identifier, "org.example.Player");
}

TEST_F(IdentityProbe, FindsNothingForOtherProgramsAndForNone) {
    EXPECT_EQ(identityOf({.pid = ProcessID{::getpid()}}).identifier, std::nullopt);
    EXPECT_NE(identityOf({.pid = ProcessID{::getpid()}}).executable, std::nullopt);
    EXPECT_EQ(identityOf({.pid = {}, .executable = scratch_.path("bin")}).executable, std::nullopt);
    EXPECT_EQ(identityOf({.pid = {}, .executable = scratch_.path("no")}).executable, std::nullopt);
}

TEST_F(IdentityProbe, ExplainsEntitlementsOfAProcessOnly) {
    const RunningProgram player(program_);
    LinuxBundles bundles(options_);
    const auto facts = probeEntitlements(bundles, {scratch_.path("drop-ins")}, {.pid = player.pid()});
    ASSERT_TRUE(facts.explanation.has_value());
    EXPECT_EQ(facts.explanation->application, BundleIdentifier("org.example.Player"));
    EXPECT_FALSE(probeEntitlements(bundles, {}, {.pid = {}, .executable = program_}).explanation.has_value());
}

}  // namespace
}  // namespace lumacast::ctl
