#pragma once
#include <cstdint>

namespace lumacast::x11 {

/// The thread of one capture source, which captures while the source's control says so and sleeps otherwise.
class CaptureLane {
public:
    virtual ~CaptureLane() = default;
    /// The thread's body: returns after quit().
    virtual void run() = 0;
    virtual bool finished() const = 0;
    /// Callable from any thread, returns at once: there is a new order.
    virtual void wake() = 0;
    /// Callable from any thread, returns at once; ends whatever the lane waits for too.
    virtual void quit() = 0;
};

}  // namespace lumacast::x11
