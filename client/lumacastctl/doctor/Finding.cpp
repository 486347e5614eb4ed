#include "client/lumacastctl/doctor/Finding.h"

#include <algorithm>

#include "client/lumacastctl/Text.h"

namespace lumacast::ctl {

namespace {

const char* severityText(Severity severity) {
    switch (severity) {
        case Severity::Ok: return "ok      ";
        case Severity::Warning: return "warning ";
        case Severity::Problem: return "problem ";
    }
    return "";
}

}  // namespace

std::string findingsText(const Findings& findings) {
    std::string text;
    for (const Finding& finding : findings)
        text += severityText(finding.severity) + finding.subject + ": " + printable(finding.text) + "\n";
    return text;
}

bool hasProblem(const Findings& findings) {
    return std::any_of(findings.begin(), findings.end(),
                       [](const Finding& finding) { return finding.severity == Severity::Problem; });
}

std::string listText(const std::vector<std::string>& parts) {
    std::string text;
    for (const std::string& part : parts) text += (text.empty() ? "" : ", ") + part;
    return text;
}

}  // namespace lumacast::ctl
