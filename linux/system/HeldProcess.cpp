#include "linux/system/HeldProcess.h"

#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace lumacast {

std::optional<HeldProcess> HeldProcess::hold(ProcessID pid) {
    if (number(pid) <= 0) return std::nullopt;
    Fd descriptor(static_cast<int>(::syscall(SYS_pidfd_open, number(pid), 0)));
    if (!descriptor) return std::nullopt;
    HeldProcess process(pid, std::move(descriptor));
    if (process.hasEnded()) return std::nullopt;
    return process;
}

bool HeldProcess::hasEnded() const {
    pollfd polled{descriptor_.get(), POLLIN, 0};
    return ::poll(&polled, 1, 0) != 0;
}

}  // namespace lumacast
