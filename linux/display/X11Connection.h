#pragma once
// One connection to the display server.

#include <xcb/xcb.h>

#include <cstdlib>
#include <memory>
#include <mutex>
#include <string>

#include "linux/ipc/Fd.h"

namespace lumacast::x11 {

struct Free {
    void operator()(void* memory) const { std::free(memory); }
};
/// What the protocol library allocated: replies, events, errors.
template <class T>
using Owned = std::unique_ptr<T, Free>;

/// Ends, from another thread, whatever a thread waits for on its display connection: a server that hangs would keep it
/// there for good. Thread-safe.
class Interrupt final {
public:
    /// The connection's socket from now on; shut down at once when the interrupt has fired already.
    void arm(int socket);
    void disarm();
    void fire();

private:
    std::mutex mutex_;
    Fd socket_;
    bool fired_ = false;
};

/// A connection to a display server of this machine, with the extensions that the port uses where the server has them.
/// Belongs to one thread; only opening, and waiting for replies, blocks, until the server answers, dies, or the
/// interrupt fires.
class X11Connection final {
public:
    /// `display` as in $DISPLAY. Null when there is no such server, or it is not on this machine: owners and shared
    /// memory don't exist across a network. The interrupt must outlive the connection.
    static std::unique_ptr<X11Connection> open(const std::string& display, Interrupt& interrupt);
    ~X11Connection();
    X11Connection(const X11Connection&) = delete;
    X11Connection& operator=(const X11Connection&) = delete;

    xcb_connection_t* get() const { return connection_; }
    int descriptor() const { return xcb_get_file_descriptor(connection_); }
    const xcb_screen_t& screen() const { return *screen_; }
    bool isRoot(xcb_window_t window) const;
    bool broken() const { return xcb_connection_has_error(connection_) != 0; }

    /// Everything that capturing takes: composite, damage, regions, shared memory by descriptor, 32-bit little-endian
    /// pixels.
    bool canCapture() const { return canCapture_; }
    bool canNameOwners() const { return canNameOwners_; }
    std::uint8_t firstDamageEvent() const { return firstDamageEvent_; }

    xcb_atom_t atom(const char* name);
    /// Whether the request succeeded; waits for the server.
    bool succeeded(xcb_void_cookie_t cookie);

private:
    X11Connection(xcb_connection_t* connection, int screenNumber, Interrupt& interrupt);
    void readExtensions();

    xcb_connection_t* const connection_;
    Interrupt& interrupt_;
    const xcb_screen_t* screen_ = nullptr;
    bool canCapture_ = false;
    bool canNameOwners_ = false;
    std::uint8_t firstDamageEvent_ = 0;
};

}  // namespace lumacast::x11
