#pragma once
#include <memory>

#include "linux/platform/DesktopRoles.h"
#include "platform/Platform.h"

namespace lumacast {

/// A platform of the real services that every Linux has, on the desktop that the port brings. To be called once, before
/// the process has a second thread. Null, after a line on standard error, when a service the daemon can't live without
/// is missing.
std::unique_ptr<PlatformOwner> makePlatformOn(const MakeDesktopRoles& makeDesktop);

}  // namespace lumacast
