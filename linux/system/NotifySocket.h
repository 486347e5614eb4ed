#pragma once
#include <string>
#include <string_view>

#include "linux/ipc/Fd.h"

namespace lumacast {

/// Messages to the service manager, in the form of sd_notify(3): one datagram of `NAME=value` lines to the Unix socket
/// named by $NOTIFY_SOCKET. Callable from any lane; never waits, a manager that does not read misses the message.
class NotifySocket final {
public:
    /// `address` is an absolute path, or '@' and an abstract name; anything else, and the empty text, is nobody.
    explicit NotifySocket(const std::string& address);

    /// Whether the message was handed over.
    bool send(std::string_view lines) const;

private:
    const std::string address_;
    Fd socket_;
};

}  // namespace lumacast
