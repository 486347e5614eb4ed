#include "linux/system/LowPriority.h"

#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

namespace lumacast {

namespace {

// Of linux/ioprio.h, which some versions can't be included from C++.
constexpr int kOfOneThread = 1, kUsualClass = 2, kClassShift = 13;

}  // namespace

void runAtLowPriority() {
    constexpr int kBehind = 10, kLast = 19;
    // For nice values a thread is a process; Linux keeps one for each.
    constexpr id_t kThisThread = 0;
    errno = 0;
    const int own = ::getpriority(PRIO_PROCESS, kThisThread);
    if (errno == 0) (void)::setpriority(PRIO_PROCESS, kThisThread, std::min(own + kBehind, kLast));
    constexpr int kLastOfUsual = 7;
    (void)::syscall(SYS_ioprio_set, kOfOneThread, 0, kUsualClass << kClassShift | kLastOfUsual);
}

}  // namespace lumacast
