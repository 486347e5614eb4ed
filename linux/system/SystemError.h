#pragma once
#include "base/Value.h"

namespace lumacast {

/// The error of a failed system call: domain kSystemErrorDomain, the error number as the code, its text as the
/// description. Callable from any lane.
Error systemError(int errorNumber);

}  // namespace lumacast
