#pragma once
#include "client/lumacastctl/doctor/Finding.h"
#include "client/lumacastctl/doctor/Identity.h"
#include "linux/system/LinuxEnvironment.h"

namespace lumacast::ctl {

/// Looks at everything that recording takes, as the daemon would meet it if it were started with this environment. Each
/// subject has its facts, a probe that gathers them and a pure check that judges them. Blocks for some seconds at
/// worst.
Findings examine(const LinuxEnvironment& environment, const LinuxEnvironment::Variables& variables,
                 const IdentityQuestion& question);

}  // namespace lumacast::ctl
