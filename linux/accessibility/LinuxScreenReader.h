#pragma once
#include <chrono>
#include <memory>
#include <string>

#include "platform/ScreenReader.h"

namespace lumacast {

/// What the accessibility bus says of the screen reader; false without a session bus, without its accessibility service
/// and until the service has answered. Follows a bus and a service that come later, go and return. One thread of its
/// own, which the bus may keep waiting without harm.
class LinuxScreenReader final : public ScreenReader {
public:
    struct Options {
        std::string address;  ///< as in $DBUS_SESSION_BUS_ADDRESS; empty: no bus, and no thread
        std::chrono::milliseconds firstRetry{500}, slowestRetry{60'000};
    };
    /// Where the user's session bus is: $DBUS_SESSION_BUS_ADDRESS (`address`), else the socket `bus` in
    /// $XDG_RUNTIME_DIR (`runtimeDirectory`, of the user), if it is set.
    static std::string sessionBus(const std::string& address, const std::string& runtimeDirectory);

    explicit LinuxScreenReader(Options options);
    /// Waits a moment for the thread.
    ~LinuxScreenReader() override;

    bool isRunning() const override;

private:
    struct State;
    const std::shared_ptr<State> state_;
};

}  // namespace lumacast
