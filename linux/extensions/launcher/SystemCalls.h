#pragma once

namespace lumacast::launcher {

/// What else keeps the program apart from the rest of the system, and so what the filter needn't do.
enum class Surroundings {
    Namespaces,  ///< it sees no process, file name or System V object but its own
    Shared,      ///< it sees them all
};

struct CallRules {
    Surroundings surroundings = Surroundings::Namespaces;
    bool network = true;
};

/// Takes system calls away from this process and whatever it becomes, for good: see README.md for which. A call that is
/// taken away fails with EPERM (ENOSYS where a program knows another way); one of another architecture ends the
/// process. 0, or the error number.
[[nodiscard]] int restrictCalls(const CallRules& rules);

}  // namespace lumacast::launcher
