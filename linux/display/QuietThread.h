#pragma once
#include <pthread.h>
#include <signal.h>

#include <thread>
#include <utility>

namespace lumacast::x11 {

/// A thread that takes no signals: those belong to the process's termination thread. Throws std::system_error when
/// there is none to be had.
template <class Body>
std::thread quietThread(Body body) {
    sigset_t all, before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    struct Restore {
        const sigset_t& mask;
        ~Restore() { pthread_sigmask(SIG_SETMASK, &mask, nullptr); }
    } const restore{before};
    return std::thread(std::move(body));
}

}  // namespace lumacast::x11
