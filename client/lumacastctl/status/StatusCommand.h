#pragma once
#include <chrono>
#include <cstdio>
#include <functional>
#include <string>

#include "client/lumacastctl/Form.h"

namespace lumacast::ctl {

/// Longer than the daemon takes to say that it is busy.
inline constexpr std::chrono::seconds kStatusLimit{4};

/// `lumacastctl status`: asks the daemon whose runtime directory this is and prints its status to `out`, or to
/// `complaints` why there is none and what to do. Answers the process's exit status. Blocks for at most `limit`.
int showStatus(const std::string& runtimeDirectory, Form form, std::FILE* out, std::FILE* complaints,
               std::chrono::milliseconds limit = kStatusLimit);

/// `lumacastctl status --watch`: a block of the running recordings, each in one write, then another whenever
/// `nextRound` returns true. Answers kGood when that returns false, kNoAnswer once the daemon has gone (`complaints`
/// gets why) or `out` takes no more. A daemon that is busy is waited for: its block says so.
int watchStatus(const std::string& runtimeDirectory, Form form, Screen screen, std::FILE* out, std::FILE* complaints,
                const std::function<bool()>& nextRound, std::chrono::milliseconds limit = kStatusLimit);

}  // namespace lumacast::ctl
