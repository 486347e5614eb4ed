#pragma once
#include "base/Identifiers.h"

namespace lumacast {

/// The process that has started `pid`, by /proc; 0 when there is none, or when it can't be told. Callable from any
/// thread; waits for nobody.
ProcessID parentOf(ProcessID pid);

/// Whether `ancestor` is the process's parent, its parent or so on, 64 of them at most. The same.
bool descendsFrom(ProcessID pid, ProcessID ancestor);

}  // namespace lumacast
