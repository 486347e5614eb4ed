#include "client/lumacastctl/doctor/Preferences.h"
#include "client/lumacastctl/doctor/Question.h"

#include "tests/contract/ScratchDirectory.h"
#include "tests/unit/lumacastctl/FindingMatchers.h"

namespace lumacast::ctl {
namespace {

using ::testing::Contains;

constexpr char kFile[] = "lumacast/com.orvane.lumacastd.conf";

/// The findings on the user's and the administrator's file; none of either where the text is null.
class DoctorPreferences : public ::testing::Test {
protected:
    Findings findingsOn(const char* users, const char* administrators = nullptr) {
        if (users) scratch_.write("home/" + std::string(kFile), users);
        if (administrators) scratch_.write("etc/" + std::string(kFile), administrators);
        return checkPreferences(probePreferences({scratch_.path("home"), scratch_.path("etc")}));
    }
    std::string usersFile() const { return scratch_.path("home/" + std::string(kFile)); }
    std::string administratorsFile() const { return scratch_.path("etc/" + std::string(kFile)); }

    ScratchDirectory scratch_;
};

TEST_F(DoctorPreferences, WithoutFilesTellWhereTheyWouldBeAndThatTheUserIsAsked) {
    const Findings findings = findingsOn(nullptr);
    EXPECT_THAT(findings,
                Contains(Finds(kOk, "no file is there; looked for " + usersFile() + ", " + administratorsFile())));
    EXPECT_THAT(findings, Contains(Finds(kOk, "LCSuppressAlert is not set: the user is asked")));
    EXPECT_THAT(findings, Contains(Finds(kOk, "LCBitRateOverride is not set")));
    EXPECT_THAT(findings, Contains(Finds(kOk, "LCFullResCapture is not set")));
}

TEST_F(DoctorPreferences, ThatAreSetAreToldWithTheFileThatDecides) {
    const Findings findings =
        findingsOn("LCBitRateOverride=8000000\n", "LCSuppressAlert=yes\nLCFullResCapture=true\nLCBitRateOverride=1\n");
    EXPECT_THAT(findings, AllAre(kOk));
    EXPECT_THAT(findings, Contains(Finds(kOk, "read from " + usersFile() + ", " + administratorsFile())));
    EXPECT_THAT(findings, Contains(Finds(kOk, "LCSuppressAlert=true (" + administratorsFile() + ")")));
    EXPECT_THAT(findings, Contains(Finds(kOk, "LCFullResCapture=true (" + administratorsFile() + ")")));
    EXPECT_THAT(findings, Contains(Finds(kOk, "LCBitRateOverride=8000000 (" + usersFile() + ")")));
}

TEST_F(DoctorPreferences, ThatSuppressNothingLetTheUserBeAsked) {
    EXPECT_THAT(findingsOn("LCSuppressAlert=false\n", "LCSuppressAlert=true\n"),
                Contains(Finds(kOk, "LCSuppressAlert=false (" + usersFile() + "): the user is asked")));
}

TEST_F(DoctorPreferences, OfTheWrongKindAreFound) {
    const Findings findings = findingsOn("LCSuppressAlert=1\nLCBitRateOverride=fast\nLCFullResCapture=2\n");
    EXPECT_THAT(findings,
                Contains(Finds(kWarning, "LCSuppressAlert=1 (" + usersFile() + ") is neither true nor false")));
    EXPECT_THAT(findings, Contains(Finds(kWarning, "LCBitRateOverride=\"fast\" (" + usersFile() + ") is no bit rate")));
    EXPECT_THAT(findings,
                Contains(Finds(kWarning, "LCFullResCapture=2 (" + usersFile() + ") is neither true nor false")));
}

TEST_F(DoctorPreferences, BehindASectionDoNotCount) {
    EXPECT_THAT(findingsOn("[General]\nLCSuppressAlert=true\n"),
                Contains(Finds(kOk, "LCSuppressAlert is not set")));
}

TEST_F(DoctorPreferences, InAFileThatCannotBeReadAreMissing) {
    scratch_.makeDirectory("home/" + std::string(kFile));
    EXPECT_THAT(findingsOn(nullptr), Contains(Finds(kWarning, usersFile() + " counts as missing")));
}

TEST_F(DoctorPreferences, InAFileThatIsTooLargeAreMissing) {
    const std::string large = "LCSuppressAlert=true\n#" + std::string(64 * 1024, 'x');
    const Findings findings = findingsOn(large.c_str());
    EXPECT_THAT(findings, Contains(Finds(kWarning, usersFile() + " counts as missing")));
    EXPECT_THAT(findings, Contains(Finds(kOk, "LCSuppressAlert is not set")));
}

TEST(DoctorQuestion, IsAskedByTheAdministratorsProgramAlone) {
    EXPECT_THAT(checkQuestion(probeQuestion({"/usr/local/bin", "/usr/bin", "/bin"})),
                Contains(Finds(kOk, "the user is asked by /usr/bin/")));
    const ScratchDirectory scratch;
    EXPECT_THAT(checkQuestion(probeQuestion({scratch.path()})),
                Contains(Finds(kProblem, "neither yad nor zenity is in the PATH")));
    std::filesystem::permissions(scratch.write("yad", "#!/bin/sh\n"), std::filesystem::perms::all);
    EXPECT_THAT(checkQuestion(probeQuestion({scratch.path()})),
                Contains(Finds(kProblem, scratch.path("yad") + " is not the administrator's")));
}

}  // namespace
}  // namespace lumacast::ctl
