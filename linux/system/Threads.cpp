#include "linux/system/Threads.h"

#include <pthread.h>
#include <signal.h>

#include <cerrno>
#include <system_error>
#include <thread>

namespace lumacast {

namespace {

/// A thread without signals; one that is not joinable when there was none to be had.
std::thread startThread(std::function<void()> body) {
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    std::thread thread;
    try {
        thread = std::thread(std::move(body));
    } catch (const std::system_error&) {
    }
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    return thread;
}

}  // namespace

bool startDetachedThread(std::function<void()> body) {
    std::thread thread = startThread(std::move(body));
    if (!thread.joinable()) return false;
    thread.detach();
    return true;
}

int performOnOwnThread(const std::function<int()>& action) {
    int result = 0;
    std::thread thread = startThread([&] { result = action(); });
    if (!thread.joinable()) return EAGAIN;
    thread.join();
    return result;
}

}  // namespace lumacast
