#include "tests/contract/RoleMatrix.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>

namespace lumacast {

std::vector<std::string> platformRoles() {
    return {"Scheduler",  "Clock",       "Ipc",         "Bundles",    "RenderServer", "AppStateMonitor",
            "DisplayCapture", "DisplayCloneControl", "ContainerWriter", "MovieExporter", "FileSystem", "Preferences",
            "DeviceInfo", "Telemetry",   "KeepAlive",   "LogSink",    "AdminService", "StoragePurgeService", "PhotoLibrary",
            "AudioInputQueue", "DeviceCapture", "UserAlert", "SystemSounds", "ScreenReader", "StoreLookup",
            "NetworkReachability", "AppExtension", "KeyedArchive"};
}

std::set<std::string> headlessRoles() {
    return {"RenderServer",    "AppStateMonitor", "DisplayCapture", "DisplayCloneControl",
            "AudioInputQueue", "DeviceCapture",   "UserAlert",      "SystemSounds"};
}

RoleMatrix::RoleMatrix(std::vector<std::string> roles, std::set<std::string> headless,
                       const std::vector<ContractOutcome>& outcomes)
    : roles_(std::move(roles)), headless_(std::move(headless)) {
    for (const std::string& role : roles_) rows_[role];
    for (const ContractOutcome& outcome : outcomes) {
        std::string_view name = outcome.suite;
        const bool isFake = name.starts_with("Fake"), isPort = name.starts_with("Port"), isHeadless = name.starts_with("Headless");
        const std::size_t slash = name.find('/');
        if ((!isFake && !isPort && !isHeadless) || slash == std::string_view::npos || !name.ends_with("Contract")) continue;
        name = name.substr(slash + 1, name.size() - slash - 1 - std::string_view("Contract").size());
        const auto row = rows_.find(name);
        if (row == rows_.end()) {
            if (std::find(unknownSuites_.begin(), unknownSuites_.end(), outcome.suite) == unknownSuites_.end())
                unknownSuites_.push_back(outcome.suite);
            continue;
        }
        MatrixCell& cell = isFake ? row->second.fake : isPort ? row->second.port : row->second.headless;
        ++(outcome.passed ? cell.passed : cell.failed);
    }
}

std::vector<std::string> RoleMatrix::emptyCells() const {
    std::vector<std::string> cells;
    for (const std::string& role : roles_) {
        const Row& row = rows_.at(role);
        if (row.fake.passed == 0) cells.push_back(role + " on fake");
        if (row.port.passed == 0) cells.push_back(role + " on port");
        if (headless_.contains(role) && row.headless.passed == 0) cells.push_back(role + " on headless");
    }
    return cells;
}

std::string RoleMatrix::text() const {
    const auto cellText = [](const MatrixCell& cell) {
        if (cell.passed + cell.failed == 0) return std::string("-");
        return std::to_string(cell.passed) + (cell.failed > 0 ? " (" + std::to_string(cell.failed) + " failed)" : "");
    };
    std::string text = "role                  fake              port              headless\n";
    for (const std::string& role : roles_) {
        const Row& row = rows_.at(role);
        const bool isOwn = headless_.contains(role) || row.headless.passed + row.headless.failed > 0;
        char line[120];
        std::snprintf(line, sizeof line, "%-20s  %-16s  %-16s  %s\n", role.c_str(), cellText(row.fake).c_str(),
                      cellText(row.port).c_str(), isOwn ? cellText(row.headless).c_str() : "the port's");
        text += line;
    }
    return text;
}

namespace {

std::vector<ContractOutcome> outcomesOfThisRun() {
    std::vector<ContractOutcome> outcomes;
    const ::testing::UnitTest& unit = *::testing::UnitTest::GetInstance();
    for (int s = 0; s < unit.total_test_suite_count(); ++s) {
        const ::testing::TestSuite& suite = *unit.GetTestSuite(s);
        for (int t = 0; t < suite.total_test_count(); ++t) {
            const ::testing::TestInfo& test = *suite.GetTestInfo(t);
            if (test.should_run() && !test.result()->Skipped())
                outcomes.push_back({suite.name(), test.result()->Passed()});
        }
    }
    return outcomes;
}

/// Whether this process runs every test there is: only then an empty cell says something.
bool isWholeRun() {
    return ::testing::GTEST_FLAG(filter) == "*" && !std::getenv("GTEST_TOTAL_SHARDS");
}

/// Prints the matrix when all tests have run, and fails the run for an empty cell.
class MatrixAtTheEnd final : public ::testing::Environment {
public:
    void TearDown() override {
        const RoleMatrix matrix(platformRoles(), headlessRoles(), outcomesOfThisRun());
        std::printf("%s", matrix.text().c_str());
        if (!isWholeRun()) return;
        for (const std::string& cell : matrix.emptyCells()) ADD_FAILURE() << "no contract test passed: " << cell;
        for (const std::string& suite : matrix.unknownSuites())
            ADD_FAILURE() << "not a role of the platform: " << suite;
    }
};

// Registered before main, as the test framework wants it.
[[maybe_unused]] const ::testing::Environment* const kMatrixAtTheEnd =
    ::testing::AddGlobalTestEnvironment(new MatrixAtTheEnd);

TEST(RoleMatrix, ACellIsEmptyUntilATestOfItHasPassed) {
    const std::vector<std::string> roles{"Clock", "Ipc"};
    EXPECT_EQ(RoleMatrix(roles, {"Ipc"}, {}).emptyCells(),
              (std::vector<std::string>{"Clock on fake", "Clock on port", "Ipc on fake", "Ipc on port", "Ipc on headless"}));
    const RoleMatrix matrix(roles, {"Clock", "Ipc"}, {{"Fake/ClockContract", true},
                                    {"Port/ClockContract", true},
                                    {"Port/ClockContract", false},
                                    {"Port/IpcContract", false},
                                    {"Headless/ClockContract", true},
                                    {"Headless/IpcContract", false},
                                    {"FakeThreads/IpcContract", true}});
    EXPECT_EQ(matrix.emptyCells(), (std::vector<std::string>{"Ipc on port", "Ipc on headless"}));
    EXPECT_NE(matrix.text().find("1 (1 failed)"), std::string::npos);
}

TEST(RoleMatrix, ASuiteOfAnUnknownRoleIsNamed) {
    const RoleMatrix matrix({"Clock"}, {},
                            {{"Fake/ClocksContract", true}, {"Fake/ClocksContract", true}, {"LimitsTest", true}});
    EXPECT_EQ(matrix.unknownSuites(), (std::vector<std::string>{"Fake/ClocksContract"}));
}

}  // namespace
}  // namespace lumacast
