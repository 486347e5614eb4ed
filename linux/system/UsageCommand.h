#pragma once
#include "linux/system/LinuxTelemetry.h"
#include "platform/AdminService.h"

namespace lumacast {

/// The administrator's question `usage`: every event that the telemetry's files still have, the oldest first, as
/// `events`, with `damagedLines`, `unreadableFiles` and `lostEvents` as counts. `telemetry` is borrowed; the command
/// waits for no disk itself.
AdminCommand usageCommand(LinuxTelemetry& telemetry);

}  // namespace lumacast
