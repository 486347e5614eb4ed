#pragma once
#include <sys/types.h>

#include <chrono>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <thread>

#include "linux/ipc/Fd.h"
#include "platform/AdminService.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// The administrator's questions on a Unix socket: a peer sends one line and gets one line of JSON, then the
/// connection is closed. A command's name, with its arguments behind it, is answered by the command, `status` by
/// the whole snapshot, any other word by the snapshot's entry of that name; what can't be answered is {"error":
/// "..."}. Only the daemon's own user and root are heard (by the kernel's word). At most 8 peers at a time, a line
/// of at most 16 KiB, and a limit for every wait; one thread serves them all and never holds the daemon up.
class LinuxAdminService final : public AdminService {
public:
    struct Limits {
        std::chrono::milliseconds request{2000};   ///< from connecting to the end of the line
        std::chrono::milliseconds snapshot{2000};  ///< for the main queue to answer
        std::chrono::milliseconds reply{5000};     ///< for the peer to read
        std::chrono::milliseconds command{60000};  ///< for a command to answer
    };
    /// Told why the service can't be offered, on the lane that resumed it. It is not offered then.
    using Unavailable = std::function<void(std::string_view reason)>;
    /// `socketPath` is where the socket will be, in a directory of this user's own.
    LinuxAdminService(Scheduler& scheduler, std::string socketPath)
        : LinuxAdminService(scheduler, std::move(socketPath), Limits()) {}
    LinuxAdminService(Scheduler& scheduler, std::string socketPath, Limits limits, Unavailable unavailable = {});
    /// Closes every connection and removes the socket. A snapshot that was asked for is not waited for.
    ~LinuxAdminService() override;

    void addCommand(std::string name, AdminCommand command) override;
    void resume(std::function<Dictionary()> snapshot) override;

    /// Whether the socket is open; false before resume, and when another daemon answers there or it could not be made.
    bool isAnswering() const { return thread_.joinable(); }

private:
    class Server;

    Scheduler& scheduler_;
    const std::string socketPath_;
    const Limits limits_;
    const Unavailable unavailable_;
    std::map<std::string, AdminCommand, std::less<>> commands_;
    std::unique_ptr<Server> server_;
    std::thread thread_;
};

/// Asks an admin service: sends `request` and answers the line that comes back. None when nobody answers within
/// `limit`. For tools and tests; blocks.
std::optional<std::string> askAdminService(const std::string& socketPath, std::string_view request,
                                           std::chrono::milliseconds limit);

}  // namespace lumacast
