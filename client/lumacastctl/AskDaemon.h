#pragma once
#include <chrono>
#include <cstdio>
#include <optional>
#include <string>

namespace lumacast::ctl {

/// Asks the daemon whose runtime directory this is and answers the line that comes back; none after writing to
/// `complaints` why there is none and what to do. A daemon that its service manager starts when it is needed is started.
/// Blocks for at most `limit`, and as long again where the daemon has to be started.
std::optional<std::string> askDaemon(const std::string& runtimeDirectory, const std::string& request,
                                     std::FILE* complaints, std::chrono::milliseconds limit);

/// Writes a complaint and answers the exit status for a daemon that gave no answer.
int complain(std::FILE* complaints, const std::string& text);

}  // namespace lumacast::ctl
