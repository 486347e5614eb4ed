#pragma once
// The process's connection to the sound server, and the thread it lives on.

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "linux/audio/PulseHandles.h"

namespace lumacast::sound {

/// A server that is there. Belongs to the sound thread.
struct PulseServer {
    pa_context& context;     ///< ready
    pa_mainloop_api& loop;   ///< what it lives on, e.g. for timers
};

/// Something on the sound thread that uses the connection. Every call comes on that thread.
class PulseUser {
public:
    virtual ~PulseUser() = default;
    /// The server is there, and what it is made of stays until serverWent. Called for every attachment and every server.
    virtual void serverCame(const PulseServer& server) = 0;
    /// The server has gone, or the user is being detached: let go of every stream and operation of the context now.
    /// Only after serverCame.
    virtual void serverWent() = 0;
    /// What it wants to hear of in serverChanged; always the same.
    virtual pa_subscription_mask_t interest() const { return PA_SUBSCRIPTION_MASK_NULL; }
    /// Something of the server has come, gone or changed; other users' interests come here too.
    virtual void serverChanged(pa_subscription_event_type_t /*event*/, std::uint32_t /*index*/) {}
};

/// One connection to the user's sound server (PulseAudio, or PipeWire in its place), and one thread on which everything
/// happens that the server has a say in. Both are there only while a user is attached: nobody attached, no thread, no
/// wake-up. While there is no server it is looked for every 100 ms to 1 s; where not even its socket is there, when that
/// comes, and rarely besides.
///
/// Thread-safe: every operation is callable from any thread, the sound thread included, and waits for nobody. The
/// library may wait on the sound thread (it reads files and asks the display server where the sound server is), so
/// nothing that has to go on without a server belongs there.
class PulseConnection final {
public:
    struct Options {
        std::string server;  ///< as in $PULSE_SERVER; empty for the user's own
        std::string applicationName = "lumacastd";
        std::chrono::milliseconds firstRetry{100}, slowestRetry{1000};
        /// The slowest where its socket is not there and is waited for: the library may know of another place.
        std::chrono::milliseconds slowestWithoutSocket{10'000};
        /// A server that has not answered by then is given up and tried again.
        std::chrono::milliseconds patience{5000};
        /// Told, on the sound thread, when no server has been there for so long although somebody uses it, once, and
        /// when one is there after that. May be empty; must not wait.
        std::function<void(bool isThere)> tell = nullptr;
        std::chrono::milliseconds toldAfter{2000};
    };

    PulseConnection() : PulseConnection(Options{}) {}
    explicit PulseConnection(Options options);
    ~PulseConnection() { end(); }
    PulseConnection(const PulseConnection&) = delete;
    PulseConnection& operator=(const PulseConnection&) = delete;

    /// Keeps the user until it is detached. False when the system has no thread left: nothing has changed then.
    [[nodiscard]] bool attach(std::shared_ptr<PulseUser> user);
    /// Lets go of the user, on the sound thread, after what was posted before. Nothing for a user that isn't attached.
    void detach(const std::shared_ptr<PulseUser>& user);
    /// Runs `task` on the sound thread, in order; it is dropped when nobody is attached.
    void post(std::function<void()> task);
    /// Detaches everybody, for good, and waits for the sound thread to end, unless it is the caller.
    void end();
    /// Whether there is a sound thread now. For tests.
    bool hasThread() const;

private:
    class Core;
    const std::shared_ptr<Core> core_;
};

/// Runs a task on the sound thread after a while, once. Belongs to the sound thread, and to what the server is made of;
/// destroying it cancels, but the task itself must not destroy it.
class PulseTimer final {
public:
    PulseTimer(pa_mainloop_api& loop, std::function<void()> task) : loop_(loop), task_(std::move(task)) {}
    ~PulseTimer() { cancel(); }
    PulseTimer(const PulseTimer&) = delete;
    PulseTimer& operator=(const PulseTimer&) = delete;

    /// Runs it after `delay`, also when it was to run at another time.
    void start(std::chrono::milliseconds delay);
    void cancel();
    bool isRunning() const { return event_ != nullptr; }

private:
    pa_mainloop_api& loop_;
    const std::function<void()> task_;
    pa_time_event* event_ = nullptr;
};

}  // namespace lumacast::sound
