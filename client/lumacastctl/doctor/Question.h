#pragma once
// How the user is asked before a recording.

#include <optional>
#include <string>
#include <vector>

#include "client/lumacastctl/doctor/Finding.h"

namespace lumacast::ctl {

struct QuestionFacts {
    std::optional<std::string> program;           ///< the one that asks, a path
    std::optional<std::string> untrustedProgram;  ///< without one: one that others than the administrator can have put there
};

/// `searchPath` as LinuxEnvironment has it. Blocks as long as the disk does.
QuestionFacts probeQuestion(const std::vector<std::string>& searchPath);

Findings checkQuestion(const QuestionFacts& facts);

}  // namespace lumacast::ctl
