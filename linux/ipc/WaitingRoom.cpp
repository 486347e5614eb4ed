#include "linux/ipc/WaitingRoom.h"

#include <algorithm>
#include <map>

namespace lumacast {

void WaitingRoom::enter(const std::shared_ptr<LinuxIpcConnection>& connection, uid_t user, ProcessID process) {
    guests_.push_back({connection.get(), connection, user, process});
}

void WaitingRoom::leave(const LinuxIpcConnection* connection) {
    guests_.remove_if([&](const Guest& guest) { return guest.key == connection; });
}

bool WaitingRoom::holds(const LinuxIpcConnection* connection) const {
    return std::any_of(guests_.begin(), guests_.end(), [&](const Guest& guest) { return guest.key == connection; });
}

std::size_t WaitingRoom::countOf(uid_t user) const {
    return static_cast<std::size_t>(
        std::count_if(guests_.begin(), guests_.end(), [&](const Guest& guest) { return guest.user == user; }));
}

std::shared_ptr<LinuxIpcConnection> WaitingRoom::firstToGo(uid_t user) const {
    std::map<ProcessID, std::size_t> counts;
    for (const Guest& guest : guests_)
        if (guest.user == user) ++counts[guest.process];
    const Guest* result = nullptr;
    std::size_t most = 0;
    for (const Guest& guest : guests_) {
        if (guest.user != user || counts[guest.process] <= most) continue;
        most = counts[guest.process];
        result = &guest;
    }
    return result ? result->connection.lock() : nullptr;
}

}  // namespace lumacast
