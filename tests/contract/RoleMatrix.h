#pragma once
// Which roles were tried on what (the fakes, the Linux port, the headless port): computed from the names of the contract tests that ran.

#include <map>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace lumacast {

/// One test that ran, by its suite's name ("Fake/ClockContract").
struct ContractOutcome {
    std::string suite;
    bool passed = false;
};

/// How many tests of one suite passed and failed on one kind of world.
struct MatrixCell {
    int passed = 0;
    int failed = 0;
};

class RoleMatrix {
public:
    /// `roles` without their ending "Contract", in the order in which they are printed.
    /// `headless` are those of them that the headless port has of its own; the others it has from the Linux port.
    RoleMatrix(std::vector<std::string> roles, std::set<std::string> headless, const std::vector<ContractOutcome>& outcomes);

    /// "Role on fake", "Role on port" or "Role on headless" for each cell without a test that passed; the last only for the
    /// roles that the headless port has of its own.
    std::vector<std::string> emptyCells() const;
    /// The suites that ran though their role is not in the list.
    const std::vector<std::string>& unknownSuites() const { return unknownSuites_; }
    /// The table for people.
    std::string text() const;

private:
    struct Row {
        MatrixCell fake, port, headless;
    };
    const std::vector<std::string> roles_;
    const std::set<std::string> headless_;
    std::map<std::string, Row, std::less<>> rows_;
    std::vector<std::string> unknownSuites_;
};

/// Every role of the platform, as the contract suites are called.
std::vector<std::string> platformRoles();
/// Those of them that the headless port has of its own.
std::set<std::string> headlessRoles();

}  // namespace lumacast
