#pragma once
#include <functional>
#include <mutex>

#include "linux/system/NotifySocket.h"
#include "platform/KeepAlive.h"

namespace lumacast {

/// Counts the transactions and tells the service manager what the daemon does: READY=1 once it runs, STATUS= whenever
/// it begins or ends being busy, STOPPING=1 when it ends.
class LinuxKeepAlive final : public KeepAlive {
public:
    /// `notify` is $NOTIFY_SOCKET, empty for none.
    explicit LinuxKeepAlive(const std::string& notify) : socket_(notify) {}

    void beginTransaction() override;
    void endTransaction() override;

    /// How many transactions are open: while it is not 0, whoever ends an idle daemon lets it be.
    int openTransactions() const;

    /// Tells the service manager that the daemon answers its clients.
    void announceReady();
    /// Tells it that the daemon ends of its own accord, and that its open movies may take `seconds` more to close.
    void announceStopping(int seconds);

private:
    void announceStatus(int open);

    mutable std::mutex mutex_;
    int open_ = 0;
    NotifySocket socket_;
};

}  // namespace lumacast
