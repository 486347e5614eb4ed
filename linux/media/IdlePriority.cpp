#include "linux/media/IdlePriority.h"

#include <sched.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace lumacast::media {

void runAtIdlePriority() {
    // For priorities a thread is named 0; of nice values Linux keeps one for each thread.
    constexpr int kThisThread = 0, kLowest = 19;
    const sched_param none{};
    if (::sched_setscheduler(kThisThread, SCHED_IDLE, &none) != 0) {
        (void)::setpriority(PRIO_PROCESS, kThisThread, kLowest);
    }
    // The library has no function for this; the numbers are those of the system call's manual page.
    constexpr int kProcess = 1, kIdleClass = 3, kClassShift = 13;
    (void)::syscall(SYS_ioprio_set, kProcess, kThisThread, kIdleClass << kClassShift);
}

}  // namespace lumacast::media
