#pragma once
#include <vector>

#include "base/Identifiers.h"

namespace lumacast {

/// Every running process of the user that this process runs as, by /proc. Callable from any thread.
std::vector<ProcessID> processesOfThisUser();

}  // namespace lumacast
