#pragma once
// The accessibility bus's word on the screen reader. On one thread.

#include <systemd/sd-bus.h>

#include <functional>
#include <memory>
#include <string>

namespace lumacast {

struct CloseBus {
    // Without flushing: that would wait for a bus that hangs.
    void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
};
struct FreeBusSlot {
    void operator()(sd_bus_slot* slot) const { sd_bus_slot_unref(slot); }
};
struct FreeBusMessage {
    void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};

using BusHandle = std::unique_ptr<sd_bus, CloseBus>;
using BusSlot = std::unique_ptr<sd_bus_slot, FreeBusSlot>;
using BusMessage = std::unique_ptr<sd_bus_message, FreeBusMessage>;

/// A connection to a session bus that follows whether a screen reader runs. Never waits for the bus.
class ScreenReaderBus final {
public:
    /// `changed` is called from dispatch() with each answer that comes.
    explicit ScreenReaderBus(std::function<void(bool)> changed) : changed_(std::move(changed)) {}

    /// Begins to connect. False when there is no bus at the address (one as in $DBUS_SESSION_BUS_ADDRESS).
    [[nodiscard]] bool open(const std::string& address);
    /// Does what can be done without waiting. False when the bus has gone.
    [[nodiscard]] bool dispatch();
    /// Sleeps until the bus has something to say or `wake` can be read.
    void wait(int wake) const;

private:
    bool follow();
    bool ask();
    void answered(sd_bus_message& reply);

    const std::function<void(bool)> changed_;
    BusHandle bus_;
    BusSlot ownerMatch_, propertyMatch_, question_;  // before the bus goes
    bool changedMeanwhile_ = false;
};

}  // namespace lumacast
