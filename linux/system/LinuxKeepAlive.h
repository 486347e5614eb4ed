#pragma once
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>

#include "linux/system/NotifySocket.h"
#include "linux/system/SleepInhibitor.h"
#include "platform/KeepAlive.h"

namespace lumacast {

/// Counts the transactions and tells the service manager what the daemon does: READY=1 once it runs, STATUS= whenever
/// it begins or ends being busy, STOPPING=1 when it ends. While it is busy the device is kept awake, where there is a
/// login manager to ask (SleepInhibitor).
class LinuxKeepAlive final : public KeepAlive {
public:
    /// `notify` is $NOTIFY_SOCKET, empty for none. Without `inhibitor` nobody is asked to keep the device awake.
    explicit LinuxKeepAlive(const std::string& notify, std::optional<SleepInhibitor::Options> inhibitor = {})
        : socket_(notify) {
        if (inhibitor) inhibitor_ = std::make_unique<SleepInhibitor>(std::move(*inhibitor));
    }

    void beginTransaction() override;
    void endTransaction() override;

    /// How many transactions are open: while it is not 0, whoever ends an idle daemon lets it be.
    int openTransactions() const;

    /// Tells the service manager that the daemon answers its clients.
    void announceReady();
    /// Tells it that the daemon ends of its own accord, and that its open movies may take `seconds` more to close. May
    /// be told again, before these have passed.
    void announceStopping(int seconds);

private:
    void busyChanged();
    void announceStatus();

    mutable std::mutex mutex_;
    int open_ = 0;
    NotifySocket socket_;
    std::unique_ptr<SleepInhibitor> inhibitor_;
};

}  // namespace lumacast
