#pragma once
#include <pthread.h>
#include <signal.h>

#include <system_error>
#include <thread>
#include <utility>

namespace lumacast {

/// Blocks all signals on the thread it lives on, and puts back what was blocked before when it goes: what is started
/// meanwhile, a thread or a program, begins without any.
class SignalsBlocked final {
public:
    SignalsBlocked() {
        sigset_t all;
        sigfillset(&all);
        pthread_sigmask(SIG_SETMASK, &all, &before_);
    }
    ~SignalsBlocked() { pthread_sigmask(SIG_SETMASK, &before_, nullptr); }
    SignalsBlocked(const SignalsBlocked&) = delete;
    SignalsBlocked& operator=(const SignalsBlocked&) = delete;

private:
    sigset_t before_;
};

/// A thread that takes no signals: the daemon's belong to its termination thread, an application's and an extension's to
/// their own code. Throws std::system_error when there is none to be had; the caller's own signals are as before then.
template <class Body>
std::thread quietThread(Body body) {
    const SignalsBlocked blocked;
    return std::thread(std::move(body));
}

/// The same, for whoever can do without: one that is not joinable when there is none to be had.
template <class Body>
std::thread quietThreadIfAny(Body body) {
    try {
        return quietThread(std::move(body));
    } catch (const std::system_error&) {
        return {};
    }
}

}  // namespace lumacast
