#include "linux/system/Threads.h"

#include <pthread.h>
#include <signal.h>

#include <system_error>
#include <thread>

namespace lumacast {

bool startDetachedThread(std::function<void()> body) {
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    bool started = true;
    try {
        std::thread(std::move(body)).detach();
    } catch (const std::system_error&) {
        started = false;
    }
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    return started;
}

}  // namespace lumacast
