#pragma once
// Whether the screen is locked or dark.

#include <xcb/xcb.h>

#include <cstdint>

#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// Watches the server's screen saver, which lockers hang on too, and its monitors' power. The server tells of the
/// screen saver; for the power it has to be asked now and then. A server without either is never blank. Belongs to one
/// thread; making one, and `look`, wait for the server. Times are nanoseconds of the steady clock.
class BlankWatch final {
public:
    static constexpr std::int64_t kLookAgain = 500'000'000;

    /// The connection must outlive the watch.
    explicit BlankWatch(X11Connection& connection);
    ~BlankWatch();
    BlankWatch(const BlankWatch&) = delete;
    BlankWatch& operator=(const BlankWatch&) = delete;

    void handle(const xcb_generic_event_t& event);
    /// Asks for everything, so that nothing that was is taken for what is.
    void look(std::int64_t now);
    std::int64_t nextLook() const { return nextLook_; }
    bool blank() const { return saverIsOn_ || monitorsAreOff_; }

private:
    X11Connection& connection_;
    const bool hasSaver_, hasPower_;
    std::uint8_t firstEvent_ = 0;
    bool saverIsOn_ = false, monitorsAreOff_ = false;
    std::int64_t nextLook_ = 0;
};

}  // namespace lumacast::x11
