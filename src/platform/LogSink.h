#pragma once
#include <string_view>

#include "base/Log.h"

namespace lumacast {

/// Where log lines leave the process; repeats of one may stand as a count. Any lane; must not block on its reader.
class LogSink {
public:
    virtual ~LogSink() = default;
    /// One line without its newline. `Print` lines go to standard output, all others to the platform log.
    virtual void write(LogLevel level, std::string_view text) = 0;
};

}  // namespace lumacast
