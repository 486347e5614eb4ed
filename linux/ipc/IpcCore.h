#pragma once
// What all connections and listeners of one LinuxIpc share.

#include <sys/types.h>

#include <array>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string_view>
#include <unordered_map>

#include "base/Identifiers.h"
#include "base/Log.h"
#include "base/Value.h"
#include "linux/ipc/Fd.h"
#include "linux/ipc/Reactor.h"
#include "linux/ipc/WaitingRoom.h"

namespace lumacast {

class LinuxIpcConnection;

/// Answers what the administrator granted to a process under a name. Called on whatever lane asks.
using EntitlementLookup = std::function<std::optional<Value>(ProcessID, std::string_view)>;

/// Counts the bytes that are kept for one user's connections. Lock-free; callable from any lane.
class ByteBudget {
public:
    /// Takes `bytes` more, unless that goes over the limit.
    [[nodiscard]] bool take(std::uint64_t bytes);
    /// Takes them in any case: bytes that can't be refused any more.
    void takeAnyway(std::uint64_t bytes) { held_ += bytes; }
    void give(std::uint64_t bytes) { held_ -= bytes; }

private:
    std::atomic<std::uint64_t> held_{0};
};

/// Counts the open connections of each user, and what is kept for them. Thread-safe (a leaf lock).
class UserTable : public std::enable_shared_from_this<UserTable> {
public:
    /// One connection's place, given back when it goes. It counts as an open connection once it is confirmed.
    class Seat {
    public:
        Seat(std::shared_ptr<UserTable> table, uid_t user, std::shared_ptr<ByteBudget> budget)
            : table_(std::move(table)), user_(user), budget_(std::move(budget)) {}
        Seat(Seat&&) = default;
        Seat(const Seat&) = delete;
        Seat& operator=(const Seat&) = delete;
        Seat& operator=(Seat&&) = delete;
        ~Seat();

        uid_t user() const { return user_; }
        const std::shared_ptr<ByteBudget>& budget() const { return budget_; }
        /// The connection has said hello. False when the user has as many open ones as the limits table allows.
        [[nodiscard]] bool confirm();

    private:
        std::shared_ptr<UserTable> table_;
        uid_t user_;
        std::shared_ptr<ByteBudget> budget_;
        bool isConfirmed_ = false;
    };

    /// None when the user has as many open connections as the limits table allows.
    std::optional<Seat> take(uid_t user);

private:
    struct User {
        std::uint64_t seats = 0;        ///< all that were taken and not given back
        std::uint64_t connections = 0;  ///< those of them that are confirmed
        std::shared_ptr<ByteBudget> budget = std::make_shared<ByteBudget>();
    };
    std::mutex mutex_;
    std::map<uid_t, User> users_;
};

class IpcCore {
public:
    IpcCore(Reactor& theReactor, Log& theLog, EntitlementLookup lookup, std::chrono::nanoseconds deadline,
            std::function<void()> unavailable);

    Reactor& reactor;
    Log& log;
    const EntitlementLookup entitlements;
    const std::chrono::nanoseconds helloDeadline;
    const std::function<void()> serviceUnavailable;
    const std::shared_ptr<UserTable> users = std::make_shared<UserTable>();

    /// What a connection's turn reads into. The reactor's own.
    std::array<std::uint8_t, 65'536> scratch;
    /// Closed for a moment when the process has no descriptor left, to take and refuse a connection. The reactor's own.
    Fd spare;
    /// Who has come in and not said hello. The reactor's own.
    WaitingRoom waitingRoom;
    /// One line for many connections turned away in a row. The reactor's own.
    BurstGate silentDropped, userFull, noDescriptorLeft;

    /// Accepted connections, owned from their acceptance until their loss has been delivered.
    void own(std::shared_ptr<LinuxIpcConnection> connection);
    void release(const LinuxIpcConnection* connection);
    void releaseAll();

private:
    std::mutex mutex_;
    std::unordered_map<const LinuxIpcConnection*, std::shared_ptr<LinuxIpcConnection>> owned_;
};

}  // namespace lumacast
