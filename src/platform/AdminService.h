#pragma once
#include <functional>

#include "base/Value.h"

namespace lumacast {

/// Answers the administrator's questions about the running daemon, on a socket of its own, to the same user or the
/// administrator only, read-only.
class AdminService {
public:
    virtual ~AdminService() = default;
    /// Begins to answer. `snapshot` is called on the main queue for each question and describes sessions and
    /// recordings.
    virtual void resume(std::function<Dictionary()> snapshot) = 0;
};

}  // namespace lumacast
