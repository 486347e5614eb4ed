#pragma once
#include <chrono>
#include <cstdio>
#include <string>

#include "client/lumacastctl/Form.h"

namespace lumacast::ctl {

/// Longer than the daemon takes to say that its disk does not answer.
inline constexpr std::chrono::seconds kUsageLimit{65};

/// `lumacastctl usage`: asks the daemon whose runtime directory this is for the recordings that have ended and prints
/// them to `out`, or to `complaints` why there is no answer and what to do. Answers the process's exit status. Blocks
/// for at most `limit`.
int showUsage(const std::string& runtimeDirectory, Form form, std::FILE* out, std::FILE* complaints,
              std::chrono::milliseconds limit = kUsageLimit);

}  // namespace lumacast::ctl
