#pragma once
// Screen frames that the test decides on.

#include <atomic>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/Clock.h"
#include "platform/DisplayCapture.h"
#include "platform/Scheduler.h"
#include "tests/fakes/FakePlane.h"
#include "tests/fakes/FaultPlan.h"

namespace lumacast {

/// What the sources of one FakeDisplayCapture share.
struct FakeCaptureSettings {
    Scheduler& scheduler;
    Clock& clock;
    FaultPlan& faults;
    std::atomic<bool> automatic{false};
    std::atomic<int> planes{8};       ///< of one source
    std::atomic<std::uint32_t> transformFlags{0};
};

/// One source. Its frame lane is a serial queue of its own. A picture comes at once after a start, when the test says
/// that something has changed (never faster than the minimum interval), and at least once a second; with the clock,
/// gate and resume stamps of the contract. Thread-safe.
class FakeDisplayCaptureSource final : public DisplayCaptureSource,
                                       public std::enable_shared_from_this<FakeDisplayCaptureSource> {
public:
    FakeDisplayCaptureSource(std::shared_ptr<FakeCaptureSettings> settings, Size size, MediaTime minimumInterval);
    ~FakeDisplayCaptureSource() override;

    void setDelegate(std::weak_ptr<DisplayCaptureDelegate> delegate) override;
    void openGate() override;
    void closeGate(GateWait wait) override;
    void start() override;
    void stop() override;
    Counters counters() const override;

    /// Delivers a new picture now, whatever the interval, if the source runs.
    void deliverFrame();
    /// Something has changed on the screen: a picture comes as soon as the interval allows.
    void change();
    /// Capture fails and ends.
    void fail(std::int32_t status);
    /// Something of higher priority takes the display; capture ends.
    void preempt();
    /// The media services were reset; capture ends.
    void mediaServicesWereReset();

    bool isGateOpen() const;
    bool isRunning() const;
    Size size() const { return size_; }
    MediaTime minimumInterval() const { return minimumInterval_; }
    SerialQueue& frameLane() { return *lane_; }

private:
    enum class Picture { New, Unchanged, Last };
    struct Pool {
        std::atomic<int> inUse{0};
    };

    void beginRun(std::uint64_t run);
    void tick(std::uint64_t run);
    void deliver(std::uint64_t run, Picture picture);
    SampleRef nextSampleLocked(Picture picture);
    std::shared_ptr<SharedPlane> makePlaneLocked(Picture picture, const MediaTime& now);
    std::unique_ptr<Timer> endLocked();
    void endAndTell(std::function<void(DisplayCaptureDelegate&, DisplayCaptureSource&)> tell);

    const std::shared_ptr<FakeCaptureSettings> settings_;
    const Size size_;
    const MediaTime minimumInterval_;
    const std::shared_ptr<SerialQueue> lane_;
    const std::shared_ptr<Pool> pool_ = std::make_shared<Pool>();

    mutable std::mutex mutex_;
    std::weak_ptr<DisplayCaptureDelegate> delegate_;
    std::shared_ptr<CaptureClock> clock_;
    std::unique_ptr<Timer> timer_;
    bool gateOpen_ = false;
    bool running_ = false;
    bool delivering_ = false;
    bool changed_ = false;
    std::uint64_t run_ = 0;
    std::uint64_t pictures_ = 0;
    std::int64_t lastDelivery_ = 0;  ///< host time
    SampleRef last_;
    std::shared_ptr<CaptureClock> lastClock_;
    std::vector<std::shared_ptr<Semaphore>> waitForDelivery_;
    Counters counters_;
};

/// A failing call ("DisplayCapture.start") is a source that fails with kStartFailed after its start. So does one of a
/// size that no picture has.
class FakeDisplayCapture final : public DisplayCapture {
public:
    static constexpr std::int32_t kStartFailed = -1;

    FakeDisplayCapture(Scheduler& scheduler, Clock& clock, FaultPlan& faults)
        : settings_(std::make_shared<FakeCaptureSettings>(scheduler, clock, faults)) {}

    std::shared_ptr<DisplayCaptureSource> makeSource(Size captureSize, MediaTime minimumInterval) override;

    /// Whether the screens of all sources change all the time, so that a picture comes every minimum interval.
    void setAutomatic(bool automatic) { settings_->automatic = automatic; }
    /// How many planes each source has; pictures that find none are dropped and counted.
    void setPlanes(int planes) { settings_->planes = planes; }
    void setTransformFlags(std::uint32_t flags) { settings_->transformFlags = flags; }
    /// Every running source delivers a picture now.
    void deliverFrames();
    /// The sources that live, oldest first.
    std::vector<std::shared_ptr<FakeDisplayCaptureSource>> sources() const;
    /// The newest one that lives, or null.
    std::shared_ptr<FakeDisplayCaptureSource> lastSource() const;

private:
    const std::shared_ptr<FakeCaptureSettings> settings_;
    mutable std::mutex mutex_;
    std::vector<std::weak_ptr<FakeDisplayCaptureSource>> sources_;
};

}  // namespace lumacast
