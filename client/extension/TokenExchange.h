#pragma once
// How a file token becomes a descriptor.

#include <functional>
#include <memory>

#include "base/Value.h"
#include "linux/ipc/Fd.h"

namespace lumacast {
class IpcConnection;
}

namespace lumacast::extension {

/// Gives a token back to the connection it came over, and gets the file for it. `exchanged` is called once, on the
/// connection's lane, with an empty descriptor when there is no file for this token.
using TokenExchange = std::function<void(const std::shared_ptr<IpcConnection>& connection, Data token,
                                         std::function<void(Fd file)> exchanged)>;

/// The transport's own way.
void exchangeOverConnection(const std::shared_ptr<IpcConnection>& connection, Data token,
                            std::function<void(Fd file)> exchanged);

}  // namespace lumacast::extension
