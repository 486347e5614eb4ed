#pragma once
#include <string>
#include <utility>
#include <vector>

namespace lumacast::ctl {

enum class Severity {
    Ok,
    Warning,  ///< recording works, but not everything does
    Problem,  ///< recording can't work, or not for the application asked about
};

/// One line of the doctor's: what was looked at, what was found and, unless all is well, what to do.
struct Finding {
    Severity severity = Severity::Ok;
    std::string subject;
    std::string text;
    bool operator==(const Finding&) const = default;
};

using Findings = std::vector<Finding>;

inline Finding ok(std::string subject, std::string text) { return {Severity::Ok, std::move(subject), std::move(text)}; }
inline Finding warning(std::string subject, std::string text) {
    return {Severity::Warning, std::move(subject), std::move(text)};
}
inline Finding problem(std::string subject, std::string text) {
    return {Severity::Problem, std::move(subject), std::move(text)};
}

/// "ok       display: …", a line each. Control characters that came in from outside are replaced.
std::string findingsText(const Findings& findings);

/// Whether there is a problem among them.
bool hasProblem(const Findings& findings);

/// The parts with ", " between them.
std::string listText(const std::vector<std::string>& parts);

}  // namespace lumacast::ctl
