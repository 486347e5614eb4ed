#pragma once
#include <string>

#include "platform/AdminService.h"
#include "platform/Scheduler.h"

namespace lumacast::media {

/// The administrator's question `movies`: what the files directly in `directory` are, as `movies`, each with its `name`;
/// its `state`, which is finished, recovered (an earlier run left it unfinished, this is what was in it), unfinished,
/// unfinishedCopy or other; `beingWritten`; and, where a player shows one, its length in `seconds`. Reads a few hundred
/// bytes of each, at background priority: the answer waits for the disk, the lane that asks doesn't. `scheduler` must
/// outlive the command.
AdminCommand moviesCommand(Scheduler& scheduler, std::string directory);

}  // namespace lumacast::media
