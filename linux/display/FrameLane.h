#pragma once
// The thread of one capture source.

#include <poll.h>

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>

#include "linux/display/CaptureControl.h"
#include "linux/display/CaptureLane.h"
#include "linux/display/CaptureScene.h"
#include "linux/display/FrameOutlet.h"
#include "linux/display/FramePacer.h"
#include "linux/display/PictureMaker.h"
#include "linux/display/Wake.h"
#include "linux/display/X11Connection.h"

namespace lumacast::x11 {

/// Captures and delivers while the control says so; sleeps otherwise. It waits for the display server on its own
/// connection, so nobody else ever waits for a server that hangs.
class FrameLane final : public CaptureLane {
public:
    FrameLane(std::string display, CaptureLaneSetup setup);

    void run() override;
    bool finished() const override { return finished_.load(std::memory_order_acquire); }
    void wake() override { wake_->signal(); }
    void quit() override;

private:
    using Order = CaptureControl::Order;
    struct Delivered {
        std::shared_ptr<Picture> picture;
        MediaTime stamp;
        std::shared_ptr<CaptureClock> clock;
        std::uint32_t transformFlags = 0;
        std::uint32_t source = 0;  ///< which it was read from, and how that was laid out; 0 when it is not known any more
        std::uint64_t layout = 0;
    };

    void work(const Order& order);
    bool beginRun(const Order& order);
    bool connect(const Order& order);
    bool followSelection(const Order& order);
    void makeMaker();
    bool screenIsTaken(const Order& order);
    bool pictureIsDue() const;

    void takePicture(const Order& order);
    bool lookAtPicture(const Order& order);
    Turn turnOf(const Order& order);
    void dropPicture(bool hadNews);
    void repeatPicture(const Order& order, MediaTime stamp, CaptureControl::Stamp kind);
    bool lastIsAsRead() const;
    bool deliver(const Order& order, Delivered what, CaptureControl::Stamp kind);
    void fail(const Order& order, std::int32_t status);
    void displayIsLost(const Order& order);
    void end(const Order& order, Telling telling);

    void forgetWindows();
    bool drainEvents(bool onlyQueued);
    std::int64_t nextDeadline(const Order& order) const;
    void sleep(std::int64_t deadline);
    void release();

    const std::string display_;
    const CaptureLaneSetup setup_;
    const std::shared_ptr<Wake> wake_ = std::make_shared<Wake>();
    Interrupt interrupt_;
    std::atomic<bool> finished_{false};

    // Of the lane alone.
    std::unique_ptr<X11Connection> connection_;
    std::unique_ptr<PictureMaker> maker_;
    std::unique_ptr<CaptureScene> scene_;
    PictureSource* shown_ = nullptr;  ///< the scene's
    FramePacer pacer_;
    std::uint64_t run_ = 0;
    std::uint64_t selectionVersion_ = 0;
    bool mirrors_ = false;  ///< the screen, not windows
    // How the screen lies in the frames of one recording, which has one clock.
    Turn turn_ = Turn::None;
    std::shared_ptr<CaptureClock> turnedFor_;
    bool pictureWanted_ = false;  ///< the current picture is due though nothing may have changed
    std::int64_t stoppedSince_ = 0;
    std::uint64_t pictures_ = 0;  ///< numbered so far
    FrameOutlet outlet_;
    Delivered last_;
};

}  // namespace lumacast::x11
