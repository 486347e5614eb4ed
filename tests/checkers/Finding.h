#pragma once

#include <string>
#include <vector>

namespace lumacast::checkers {

/// One thing that is wrong, in words a person can act on. No findings: the check passed.
using Findings = std::vector<std::string>;

}  // namespace lumacast::checkers
