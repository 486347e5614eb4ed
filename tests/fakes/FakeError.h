#pragma once
#include <string>

#include "base/Value.h"

namespace lumacast {

/// The error a fake answers where the system below would have said `number`.
inline Error fakeSystemError(int number) { return Error(std::string(kSystemErrorDomain), number); }

}  // namespace lumacast
