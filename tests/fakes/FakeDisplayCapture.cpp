#include "tests/fakes/FakeDisplayCapture.h"

#include <algorithm>
#include <cmath>
#include <utility>

namespace lumacast {

namespace {

constexpr std::chrono::milliseconds kCloseWait{100};
constexpr std::int64_t kLongestPause = 1'000'000'000;
constexpr std::int64_t kFallbackInterval = 16'666'667;
constexpr double kLargestSide = 16'384;

bool canBeCaptured(const Size& size) {
    return size.width >= 1 && size.height >= 1 && size.width <= kLargestSide && size.height <= kLargestSide;
}

std::int64_t nanosecondsOf(const MediaTime& interval) {
    const double seconds = interval.seconds();
    return seconds > 0 && seconds < 3600 ? static_cast<std::int64_t>(std::llround(seconds * 1e9)) : kFallbackInterval;
}

}  // namespace

FakeDisplayCaptureSource::FakeDisplayCaptureSource(std::shared_ptr<FakeCaptureSettings> settings, Size size,
                                                   MediaTime minimumInterval)
    : settings_(std::move(settings)),
      size_{std::trunc(size.width), std::trunc(size.height)},
      minimumInterval_(minimumInterval),
      lane_(settings_->scheduler.serialQueue("frame lane")) {}

FakeDisplayCaptureSource::~FakeDisplayCaptureSource() = default;

void FakeDisplayCaptureSource::setDelegate(std::weak_ptr<DisplayCaptureDelegate> delegate) {
    const std::lock_guard lock(mutex_);
    delegate_.swap(delegate);
}

void FakeDisplayCaptureSource::openGate() {
    std::shared_ptr<CaptureClock> clock = settings_->clock.captureClock();
    const std::lock_guard lock(mutex_);
    if (!clock) return;
    clock_ = std::move(clock);
    gateOpen_ = true;
}

std::unique_ptr<Timer> FakeDisplayCaptureSource::endLocked() {
    running_ = false;
    return std::move(timer_);
}

void FakeDisplayCaptureSource::closeGate(GateWait wait) {
    std::shared_ptr<Semaphore> delivered;
    if (wait == GateWait::UntilDelivered && !lane_->isCurrent()) delivered = settings_->scheduler.semaphore(0);
    std::unique_ptr<Timer> timer;
    {
        const std::lock_guard lock(mutex_);
        gateOpen_ = false;
        timer = endLocked();
        if (!delivering_) delivered.reset();
        if (delivered) waitForDelivery_.push_back(delivered);
    }
    timer.reset();
    // Whether it was in time makes no difference: from here on nothing new is delivered.
    if (delivered) (void)delivered->waitFor(kCloseWait);
    const std::lock_guard lock(mutex_);
    if (clock_ && !gateOpen_) clock_->stand();
}

void FakeDisplayCaptureSource::start() {
    std::uint64_t run = 0;
    {
        const std::lock_guard lock(mutex_);
        if (!gateOpen_ || running_) return;
        running_ = true;
        run = ++run_;
    }
    if (!canBeCaptured(size_) || settings_->faults.fails("DisplayCapture.start")) return fail(FakeDisplayCapture::kStartFailed);
    const std::weak_ptr<FakeDisplayCaptureSource> weak = weak_from_this();
    lane_->async([weak, run] {
        if (const auto self = weak.lock()) self->beginRun(run);
    });
    auto timer =
        settings_->scheduler.timer(lane_, std::chrono::nanoseconds(nanosecondsOf(minimumInterval_)), [weak, run] {
            if (const auto self = weak.lock()) self->tick(run);
        });
    const std::lock_guard lock(mutex_);
    if (running_ && run_ == run) timer_.swap(timer);
}

void FakeDisplayCaptureSource::stop() {
    std::unique_ptr<Timer> timer;
    const std::lock_guard lock(mutex_);
    timer = endLocked();
}

DisplayCaptureSource::Counters FakeDisplayCaptureSource::counters() const {
    const std::lock_guard lock(mutex_);
    return counters_;
}

void FakeDisplayCaptureSource::deliverFrame() {
    std::uint64_t run = 0;
    {
        const std::lock_guard lock(mutex_);
        if (!running_) return;
        run = run_;
    }
    lane_->async([weak = weak_from_this(), run] {
        if (const auto self = weak.lock()) self->deliver(run, Picture::New);
    });
}

void FakeDisplayCaptureSource::change() {
    const std::lock_guard lock(mutex_);
    changed_ = true;
}

// The frame lane

void FakeDisplayCaptureSource::beginRun(std::uint64_t run) {
    bool resumes = false;
    {
        const std::lock_guard lock(mutex_);
        resumes = last_ && lastClock_ == clock_;
    }
    if (resumes) deliver(run, Picture::Last);
    deliver(run, Picture::New);
}

void FakeDisplayCaptureSource::tick(std::uint64_t run) {
    bool changed = settings_->automatic;
    {
        const std::lock_guard lock(mutex_);
        const std::int64_t since = settings_->clock.hostTime().nanoseconds - lastDelivery_;
        changed = changed || changed_;
        if (since < nanosecondsOf(minimumInterval_) || (!changed && since < kLongestPause)) return;
    }
    deliver(run, changed ? Picture::New : Picture::Unchanged);
}

void FakeDisplayCaptureSource::deliver(std::uint64_t run, Picture picture) {
    std::shared_ptr<DisplayCaptureDelegate> delegate;
    SampleRef sample;
    {
        const std::lock_guard lock(mutex_);
        if (!running_ || run_ != run) return;
        delegate = delegate_.lock();
        if (!delegate) return;
        sample = nextSampleLocked(picture);
        if (!sample) return;
        delivering_ = true;
        lastDelivery_ = settings_->clock.hostTime().nanoseconds;
    }
    delegate->screenCaptureControllerDidReceiveSampleBuffer(*this, sample, settings_->transformFlags);
    std::vector<std::shared_ptr<Semaphore>> waiting;
    {
        const std::lock_guard lock(mutex_);
        delivering_ = false;
        ++counters_.delivered;
        waiting.swap(waitForDelivery_);
    }
    for (const auto& semaphore : waiting) semaphore->signal();
}

SampleRef FakeDisplayCaptureSource::nextSampleLocked(Picture picture) {
    if (picture == Picture::Last) {
        clock_->run();
        return last_;
    }
    if (pool_->inUse >= settings_->planes) {
        ++counters_.dropped;
        changed_ = true;  // shown with the next picture
        return nullptr;
    }
    clock_->run();
    if (picture == Picture::New) changed_ = false;
    const MediaTime now = clock_->now();
    last_ = SampleBuffer::makeVideo(PixelBuffer(makePlaneLocked(picture, now)), now, minimumInterval_);
    lastClock_ = clock_;
    return last_;
}

std::shared_ptr<SharedPlane> FakeDisplayCaptureSource::makePlaneLocked(Picture picture, const MediaTime& now) {
    ++pool_->inUse;
    const auto width = static_cast<std::int32_t>(size_.width), height = static_cast<std::int32_t>(size_.height);
    std::vector<PixelRect> damage;
    if (picture == Picture::New) damage.push_back({0, 0, width, height});
    return {new FakePlane(width, height, ++pictures_, std::move(damage), now.value),
            [pool = pool_](const FakePlane* plane) {
                delete plane;
                --pool->inUse;
            }};
}

// Failures

void FakeDisplayCaptureSource::endAndTell(std::function<void(DisplayCaptureDelegate&, DisplayCaptureSource&)> tell) {
    std::unique_ptr<Timer> timer;
    std::uint64_t run = 0;
    {
        const std::lock_guard lock(mutex_);
        timer = endLocked();
        run = run_;
    }
    timer.reset();
    settings_->scheduler.mainQueue().async([weak = weak_from_this(), run, tell = std::move(tell)] {
        const auto self = weak.lock();
        if (!self) return;
        std::shared_ptr<DisplayCaptureDelegate> delegate;
        {
            const std::lock_guard lock(self->mutex_);
            if (self->run_ == run && !self->running_) delegate = self->delegate_.lock();
        }
        if (delegate) tell(*delegate, *self);
    });
}

void FakeDisplayCaptureSource::fail(std::int32_t status) {
    endAndTell(
        [status](auto& delegate, auto& source) { delegate.screenCaptureControllerDidFailWithStatus(source, status); });
}

void FakeDisplayCaptureSource::preempt() {
    endAndTell([](auto& delegate, auto& source) { delegate.screenCaptureControllerWasPreempted(source); });
}

void FakeDisplayCaptureSource::mediaServicesWereReset() {
    endAndTell([](auto& delegate, auto& source) { delegate.screenCaptureControllerMediaServicesWereReset(source); });
}

bool FakeDisplayCaptureSource::isGateOpen() const {
    const std::lock_guard lock(mutex_);
    return gateOpen_;
}

bool FakeDisplayCaptureSource::isRunning() const {
    const std::lock_guard lock(mutex_);
    return running_;
}

// The maker

std::shared_ptr<DisplayCaptureSource> FakeDisplayCapture::makeSource(Size captureSize, MediaTime minimumInterval) {
    auto source = std::make_shared<FakeDisplayCaptureSource>(settings_, captureSize, minimumInterval);
    const std::lock_guard lock(mutex_);
    std::erase_if(sources_, [](const auto& weak) { return weak.expired(); });
    sources_.push_back(source);
    return source;
}

void FakeDisplayCapture::deliverFrames() {
    for (const auto& source : sources()) source->deliverFrame();
}

std::vector<std::shared_ptr<FakeDisplayCaptureSource>> FakeDisplayCapture::sources() const {
    std::vector<std::shared_ptr<FakeDisplayCaptureSource>> result;
    const std::lock_guard lock(mutex_);
    for (const auto& weak : sources_)
        if (auto source = weak.lock()) result.push_back(std::move(source));
    return result;
}

std::shared_ptr<FakeDisplayCaptureSource> FakeDisplayCapture::lastSource() const {
    const auto all = sources();
    return all.empty() ? nullptr : all.back();
}

}  // namespace lumacast
