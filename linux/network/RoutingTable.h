#pragma once
#include <cstdint>
#include <optional>

#include "linux/ipc/Fd.h"
#include "linux/network/NetworkAddress.h"

namespace lumacast {

/// Where packets to a host would go.
enum class Way {
    None,             ///< nowhere
    NeedsConnection,  ///< over a device that has no connection now
    Usable,
};

/// The kernel's routing table, asked through rtnetlink (rtnetlink(7)). It is only read: no packet is sent, no neighbour
/// is looked for. Belongs to one thread, whose network namespace it is of.
class RoutingTable final {
public:
    RoutingTable();

    /// The way to an address now; none when the table can't be read. Waits at most 200 ms, for a kernel that does not
    /// answer.
    std::optional<Way> wayTo(const NetworkAddress& address);

private:
    struct Answer;
    struct Request;
    std::optional<Answer> ask(Request& request);
    std::optional<Way> stateOf(int device);

    Fd socket_;
    std::uint32_t sequence_ = 0;
};

}  // namespace lumacast
