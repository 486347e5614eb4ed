#pragma once

namespace lumacast::ctl {

/// How an answer is written: for people, or the daemon's own, one line of JSON.
enum class Form { Text, Json };

/// Where it is written: a terminal shows only the newest, in place of what was there; anything else gets one after the
/// other, without escape codes.
enum class Screen { Terminal, Plain };

/// Takes back the line that a terminal shows.
inline constexpr char kClearLine[] = "\r\033[K";

}  // namespace lumacast::ctl
