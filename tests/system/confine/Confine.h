#pragma once
#include <unistd.h>

#include "tests/system/confine/ServiceSection.h"

namespace lumacast::test {

/// Takes the administrator's rights.
void confineFiles(ServiceSection& service);

/// Last: what comes before may need a call that the unit forbids.
void confineSystemCalls(ServiceSection& service);

}  // namespace lumacast::test
