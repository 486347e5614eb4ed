#include "linux/system/Threads.h"

#include <cerrno>
#include <thread>
#include <utility>

#include "linux/ipc/QuietThread.h"

namespace lumacast {

bool startDetachedThread(std::function<void()> body) {
    std::thread thread = quietThreadIfAny(std::move(body));
    if (!thread.joinable()) return false;
    thread.detach();
    return true;
}

int performOnOwnThread(const std::function<int()>& action) {
    int result = 0;
    std::thread thread = quietThreadIfAny([&] { result = action(); });
    if (!thread.joinable()) return EAGAIN;
    thread.join();
    return result;
}

}  // namespace lumacast
