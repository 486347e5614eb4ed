#pragma once

namespace lumacast::ctl {

/// How an answer is written: for people, or the daemon's own, one line of JSON.
enum class Form { Text, Json };

}  // namespace lumacast::ctl
