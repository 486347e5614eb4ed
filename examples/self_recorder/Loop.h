#pragma once

#include <functional>
#include <map>
#include <memory>

namespace lumacast::example {

/// The application's only loop: waits for descriptors and calls what was registered for them. Everything in the
/// application runs on it. Not thread-safe.
class Loop final {
public:
    using Handler = std::function<void()>;

    /// Calls `handler` whenever the descriptor can be read or has failed. The caller keeps the descriptor open until
    /// `unwatch`. Both may be called from a handler.
    void watch(int descriptor, Handler handler);
    void unwatch(int descriptor);

    /// `handler` runs before each wait, for work that waits in a library's own buffers.
    void beforeWaiting(Handler handler) { beforeWaiting_ = std::move(handler); }

    /// Runs until `quit`; answers the status given there. 1 when waiting fails.
    int run();
    void quit(int status);

private:
    std::map<int, std::shared_ptr<Handler>> handlers_;
    Handler beforeWaiting_;
    bool running_ = true;
    int status_ = 0;
};

}  // namespace lumacast::example
