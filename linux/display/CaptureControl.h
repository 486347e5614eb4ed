#pragma once
// What the request lane tells a frame lane, and when a frame may be delivered.

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <thread>

#include "platform/CaptureClock.h"
#include "platform/DisplayCapture.h"

namespace lumacast::x11 {

/// The gate, the clock and the delegate of one source. Thread-safe; nothing waits here but closeGate, for at most 100
/// ms.
class CaptureControl final {
public:
    /// What the frame lane is to do. `run` is another number after each start.
    struct Order {
        bool quit = false;
        bool running = false;
        std::uint64_t run = 0;
        std::shared_ptr<CaptureClock> clock;
    };
    enum class Stamp {
        Fresh,  ///< the time the picture was taken: the clock's own where it still stands
        Kept,   ///< a picture's earlier stamp
    };

    void setDelegate(std::weak_ptr<DisplayCaptureDelegate> delegate);
    std::shared_ptr<DisplayCaptureDelegate> delegate() const;
    /// Whom to tell of the end of a run: nobody once the source has been started again.
    std::shared_ptr<DisplayCaptureDelegate> delegateOfEnded(std::uint64_t run) const;

    /// Without a clock the gate stays closed.
    void openGate(std::shared_ptr<CaptureClock> clock);
    void closeGate(GateWait wait);
    /// Whether frames are to be delivered from now on: not while the gate is closed.
    bool start();
    void stop();
    /// The lane ends. For good.
    void quit();

    Order order() const;
    /// Before a delivery: its stamp, and the clock runs; none when the order has changed meanwhile.
    std::optional<MediaTime> beginDelivery(const Order& order, MediaTime stamp, Stamp kind);
    void endDelivery();
    /// The run has failed; false when it was no longer wanted.
    bool endRun(const Order& order);

    void countDelivered() { delivered_.fetch_add(1, std::memory_order_relaxed); }
    void countDropped(std::uint64_t pictures) { dropped_.fetch_add(pictures, std::memory_order_relaxed); }
    DisplayCaptureSource::Counters counters() const { return {delivered_.load(), dropped_.load()}; }

private:
    mutable std::mutex mutex_;
    std::condition_variable deliveryEnded_;
    std::weak_ptr<DisplayCaptureDelegate> delegate_;
    std::shared_ptr<CaptureClock> clock_;
    bool gateOpen_ = false;
    bool running_ = false;
    bool quit_ = false;
    bool delivering_ = false;
    std::uint64_t run_ = 0;
    std::thread::id deliveryThread_;
    std::atomic<std::uint64_t> delivered_{0};
    std::atomic<std::uint64_t> dropped_{0};
};

}  // namespace lumacast::x11
