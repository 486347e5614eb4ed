#pragma once
#include <chrono>
#include <cstdio>
#include <string>

namespace lumacast::ctl {

/// `lumacastctl status`: asks the daemon whose runtime directory this is and prints its status to `out`, or to
/// `complaints` why there is none and what to do. Answers the process's exit status. Blocks for at most `limit`, which
/// is longer than the daemon takes to say that it is busy.
int showStatus(const std::string& runtimeDirectory, std::FILE* out, std::FILE* complaints,
               std::chrono::milliseconds limit = std::chrono::seconds(4));

}  // namespace lumacast::ctl
