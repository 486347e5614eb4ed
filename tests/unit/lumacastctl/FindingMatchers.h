#pragma once
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "client/lumacastctl/doctor/Finding.h"

namespace lumacast::ctl {

inline constexpr auto kOk = Severity::Ok;
inline constexpr auto kWarning = Severity::Warning;
inline constexpr auto kProblem = Severity::Problem;

inline void PrintTo(const Finding& finding, std::ostream* out) { *out << findingsText({finding}); }

/// A finding of that severity whose text has `part` in it.
MATCHER_P2(Finds, severity, part, "") {
    (void)result_listener;
    return arg.severity == severity && arg.text.find(part) != std::string::npos;
}

/// All findings are of that severity, and there is at least one.
MATCHER_P(AllAre, severity, "") {
    (void)result_listener;
    return !arg.empty() &&
           std::all_of(arg.begin(), arg.end(), [this](const Finding& f) { return f.severity == severity; });
}

}  // namespace lumacast::ctl
