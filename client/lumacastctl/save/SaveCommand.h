#pragma once
#include <chrono>
#include <cstdio>
#include <functional>
#include <string>

#include "client/lumacastctl/Form.h"

namespace lumacast::ctl {

/// The absolute path of what a user names, its folder's links resolved; the last component stays what it is. Where the
/// folder is not there: the path as it was given, made absolute.
std::string moviePath(const std::string& named);

/// `lumacastctl save FILE`: has the daemon whose runtime directory this is save a movie, shows on `complaints` how far
/// it is (a bar that moves where that is a terminal, else a line for each tenth), and prints to `out` where the copy
/// is. As JSON: the daemon's own words to `out`, a line whenever they change, and nothing else. `begun` is called once
/// the daemon has taken the movie; `nextRound` waits between two questions, and answers false to leave it to the
/// daemon. A daemon that is busy is asked again. Answers the process's exit status. Blocks for as long as it takes; for
/// at most `limit` for each answer.
int saveMovie(const std::string& runtimeDirectory, const std::string& path, Form form, Screen progress, std::FILE* out,
              std::FILE* complaints, const std::function<void()>& begun, const std::function<bool()>& nextRound,
              std::chrono::milliseconds limit = std::chrono::seconds(10));

}  // namespace lumacast::ctl
