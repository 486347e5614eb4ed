#include "linux/display/CaptureControl.h"

#include <chrono>

namespace lumacast::x11 {
namespace {

constexpr std::chrono::milliseconds kCloseWait{100};

}  // namespace

void CaptureControl::setDelegate(std::weak_ptr<DisplayCaptureDelegate> delegate) {
    const std::lock_guard lock(mutex_);
    delegate_ = std::move(delegate);
}

std::shared_ptr<DisplayCaptureDelegate> CaptureControl::delegate() const {
    const std::lock_guard lock(mutex_);
    return delegate_.lock();
}

std::shared_ptr<DisplayCaptureDelegate> CaptureControl::delegateOfEnded(std::uint64_t run) const {
    const std::lock_guard lock(mutex_);
    return run_ == run && !running_ ? delegate_.lock() : nullptr;
}

void CaptureControl::openGate(std::shared_ptr<CaptureClock> clock) {
    const std::lock_guard lock(mutex_);
    if (!clock) return;
    // Another recording's clock while this one still runs: its pictures begin anew.
    if (clock_ != clock) ++run_;
    clock_ = std::move(clock);
    gateOpen_ = true;
}

void CaptureControl::closeGate(GateWait wait) {
    std::unique_lock lock(mutex_);
    gateOpen_ = false;
    running_ = false;
    if (wait == GateWait::UntilDelivered && deliveryThread_ != std::this_thread::get_id())
        deliveryEnded_.wait_until(lock, std::chrono::steady_clock::now() + kCloseWait, [this] { return !delivering_; });
    if (clock_ && !gateOpen_) clock_->stand();
}

bool CaptureControl::start() {
    const std::lock_guard lock(mutex_);
    if (!gateOpen_ || quit_) return false;
    if (!running_) ++run_;
    running_ = true;
    return true;
}

void CaptureControl::stop() {
    const std::lock_guard lock(mutex_);
    running_ = false;
}

void CaptureControl::quit() {
    const std::lock_guard lock(mutex_);
    quit_ = true;
    running_ = false;
}

CaptureControl::Order CaptureControl::order() const {
    const std::lock_guard lock(mutex_);
    return {quit_, running_, run_, clock_};
}

std::optional<MediaTime> CaptureControl::beginDelivery(const Order& order, MediaTime stamp, Stamp kind) {
    const std::lock_guard lock(mutex_);
    if (!running_ || run_ != order.run) return std::nullopt;
    if (kind == Stamp::Fresh && !clock_->isRunning()) stamp = clock_->now();
    clock_->run();
    delivering_ = true;
    deliveryThread_ = std::this_thread::get_id();
    return stamp;
}

void CaptureControl::endDelivery() {
    {
        const std::lock_guard lock(mutex_);
        delivering_ = false;
        deliveryThread_ = {};
    }
    deliveryEnded_.notify_all();
}

bool CaptureControl::endRun(const Order& order) {
    const std::lock_guard lock(mutex_);
    if (!running_ || run_ != order.run) return false;
    running_ = false;
    return true;
}

}  // namespace lumacast::x11
