#include "linux/ipc/IpcCore.h"

#include <fcntl.h>

#include "base/Limits.h"
#include "linux/ipc/LinuxIpcConnection.h"

namespace lumacast {

bool ByteBudget::take(std::uint64_t bytes) {
    if (held_.fetch_add(bytes) + bytes <= limitOf(Limit::HeldBytesPerUser)) return true;
    held_ -= bytes;
    return false;
}

UserTable::Seat::~Seat() {
    if (!table_) return;
    const std::lock_guard lock(table_->mutex_);
    const auto found = table_->users_.find(user_);
    if (isConfirmed_) --found->second.connections;
    if (--found->second.seats == 0) table_->users_.erase(found);
}

bool UserTable::Seat::confirm() {
    const std::lock_guard lock(table_->mutex_);
    User& entry = table_->users_.at(user_);
    if (entry.connections >= limitOf(Limit::ConnectionsPerUser)) return false;
    ++entry.connections;
    isConfirmed_ = true;
    return true;
}

std::optional<UserTable::Seat> UserTable::take(uid_t user) {
    const std::lock_guard lock(mutex_);
    User& entry = users_[user];
    if (entry.connections >= limitOf(Limit::ConnectionsPerUser)) return std::nullopt;
    ++entry.seats;
    return Seat(shared_from_this(), user, entry.budget);
}

IpcCore::IpcCore(Reactor& theReactor, Log& theLog, EntitlementLookup lookup, std::chrono::nanoseconds deadline,
                 std::function<void()> unavailable)
    : reactor(theReactor),
      log(theLog),
      entitlements(std::move(lookup)),
      helloDeadline(deadline),
      serviceUnavailable(std::move(unavailable)),
      spare(open("/dev/null", O_RDONLY | O_CLOEXEC)) {}

void IpcCore::own(std::shared_ptr<LinuxIpcConnection> connection) {
    const std::lock_guard lock(mutex_);
    const LinuxIpcConnection* key = connection.get();
    owned_.emplace(key, std::move(connection));
}

void IpcCore::release(const LinuxIpcConnection* connection) {
    std::shared_ptr<LinuxIpcConnection> released;
    const std::lock_guard lock(mutex_);
    const auto found = owned_.find(connection);
    if (found == owned_.end()) return;
    released = std::move(found->second);
    owned_.erase(found);
}

void IpcCore::releaseAll() {
    decltype(owned_) released;
    const std::lock_guard lock(mutex_);
    released.swap(owned_);
}

}  // namespace lumacast
