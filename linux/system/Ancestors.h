#pragma once
#include "base/Identifiers.h"

namespace lumacast {

/// The process that has started `pid`, by /proc; 0 when there is none, or when it can't be told. Callable from any
/// thread; waits for nobody.
ProcessID parentOf(ProcessID pid);

}  // namespace lumacast
