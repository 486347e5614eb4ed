#include "linux/system/LinuxKeepAlive.h"

namespace lumacast {

void LinuxKeepAlive::beginTransaction() {
    const std::lock_guard lock(mutex_);  // held while sending, which never waits: the last status told is the true one
    if (++open_ == 1) busyChanged();
}

void LinuxKeepAlive::endTransaction() {
    const std::lock_guard lock(mutex_);
    if (open_ == 0) return;  // an end without a begin must not make a later transaction invisible
    if (--open_ == 0) busyChanged();
}

int LinuxKeepAlive::openTransactions() const {
    const std::lock_guard lock(mutex_);
    return open_;
}

void LinuxKeepAlive::announceReady() {
    const std::lock_guard lock(mutex_);
    socket_.send("READY=1\n");
    announceStatus();
}

void LinuxKeepAlive::announceStopping(int seconds) {
    const std::lock_guard lock(mutex_);
    socket_.send("STOPPING=1\nEXTEND_TIMEOUT_USEC=" + std::to_string(static_cast<long long>(seconds) * 1'000'000) +
                 "\n");
}

void LinuxKeepAlive::busyChanged() {
    announceStatus();
    if (inhibitor_) inhibitor_->setBusy(open_ > 0);
}

void LinuxKeepAlive::announceStatus() { socket_.send(open_ > 0 ? "STATUS=Recording.\n" : "STATUS=Idle.\n"); }

}  // namespace lumacast
