#include "examples/self_recorder/Loop.h"

#include <poll.h>

#include <cerrno>
#include <vector>

namespace lumacast::example {

void Loop::watch(int descriptor, Handler handler) {
    handlers_[descriptor] = std::make_shared<Handler>(std::move(handler));
}

void Loop::unwatch(int descriptor) {
    handlers_.erase(descriptor);
}

void Loop::quit(int status) {
    running_ = false;
    status_ = status;
}

int Loop::run() {
    std::vector<pollfd> waiting;
    while (running_) {
        if (beforeWaiting_) beforeWaiting_();
        if (!running_) break;
        waiting.clear();
        for (const auto& [descriptor, handler] : handlers_) waiting.push_back({descriptor, POLLIN, 0});
        if (::poll(waiting.data(), waiting.size(), -1) < 0) {
            if (errno == EINTR) continue;
            return 1;
        }
        for (const pollfd& entry : waiting) {
            const auto found = handlers_.find(entry.fd);
            if (entry.revents == 0 || found == handlers_.end() || !running_) continue;
            const std::shared_ptr<Handler> handler = found->second;  // it may unwatch itself
            (*handler)();
        }
    }
    return status_;
}

}  // namespace lumacast::example
